// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovradrnode/dr_node.h>

#include <set>
#include <string>
#include <vector>

namespace Ovradr {

/// The id of this node, created if there is none.
[[nodiscard]] Expected<std::string> localNode();

/// The ids of this node and of all nodes that a credential reaches.
[[nodiscard]] Expected<std::set<std::string>> listNodes();

/// Every credential of this node, lasting and temporary; a failure if not all can be read.
[[nodiscard]] Expected<std::vector<OvraDRNode::DRNode>> allCredentials();

/// The one of `ids` that equals `text` or is the only one to begin with it.
/// \param what  what the ids name, e.g. "node"
/// \param hint  what to do if there is none
[[nodiscard]] Expected<std::string> chooseId(const std::set<std::string> &ids,
                                             const std::string &text, const std::string &what,
                                             const std::string &hint);

/// The node id for what a person typed: "local", a node id, or a unique prefix of one. Only this
/// node and nodes that a credential reaches are known.
[[nodiscard]] Expected<std::string> resolveNode(const std::string &text);

struct FoundCred {
    OvraDRNode::DRNode record;
    bool temporary = false;
};

/// The credential, lasting or temporary, for its id or a unique prefix of it.
[[nodiscard]] Expected<FoundCred> resolveCred(const std::string &text);

} // namespace Ovradr
