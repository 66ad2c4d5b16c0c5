// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovradrnode/dr_node.h>

#include <set>
#include <string>

namespace Ovradr {

/// The id of this node, made when there is none.
[[nodiscard]] Expected<std::string> localNode();

/// The ids of all nodes that a credential reaches, and of this one.
[[nodiscard]] Expected<std::set<std::string>> listNodes();

/// The one of `ids` that is `text` or, alone among them, begins with it.
/// \param what  what the ids name, e.g. "node"
/// \param hint  what to do when there is none
[[nodiscard]] Expected<std::string> chooseId(const std::set<std::string> &ids,
                                             const std::string &text, const std::string &what,
                                             const std::string &hint);

/// The node id that a person means: "local", a node id, or the beginning of only one. Only nodes
/// that a credential reaches are known, and this one.
[[nodiscard]] Expected<std::string> resolveNode(const std::string &text);

struct FoundCred {
    OvraDRNode::DRNode record;
    bool temporary = false;
};

/// The credential, lasting or temporary, that a person means by its id or by the beginning of only
/// one.
[[nodiscard]] Expected<FoundCred> resolveCred(const std::string &text);

} // namespace Ovradr
