// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "shared/node_names.h"

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

/// What NODE may be, for the help of commands.
inline constexpr char kNodeHelp[] = "\"local\", a name, a node id, or the beginning of one";

/// The one of `ids` that equals `text` or is the only one to begin with it.
/// \param what  what the ids name, e.g. "node"
/// \param hint  what to do if there is none
[[nodiscard]] Expected<std::string> chooseId(const std::set<std::string> &ids,
                                             const std::string &text, const std::string &what,
                                             const std::string &hint);

/// The one of the nodes that a person means: by its id, or as the only one by the beginning of its
/// id, the name that a person gave it, or its host name, in any case. Two that `text` means are
/// never told apart by a rank of these: a peer names itself.
/// \param what, hint  as for chooseId()
[[nodiscard]] Expected<std::string> chooseNode(const std::set<std::string> &ids,
                                               const std::string &text, const std::string &what,
                                               const std::string &hint);

/// The node id for what a person typed: "local", or as chooseNode() has it. Only this node and
/// nodes that a credential reaches are known.
[[nodiscard]] Expected<std::string> resolveNode(const std::string &text);

/// The same, also among nodes that only reach this one, and those that something is noted about.
[[nodiscard]] Expected<std::string> resolveAnyNode(const std::string &text);

/// Members "node_id", "name" (what people are shown), "hostname", and "comment" where there is one.
Json::Value nodeJson(const std::string &nodeId, const OvraApps::NodeName &name);

/// "nas2 (3f2a1b2c)", or the id of a node without a name.
std::string nodeText(const std::string &nodeId, const OvraApps::NodeName &name);

struct FoundCred {
    OvraDRNode::DRNode record;
    bool temporary = false;
};

/// The credential, lasting or temporary, for its id or a unique prefix of it.
[[nodiscard]] Expected<FoundCred> resolveCred(const std::string &text);

} // namespace Ovradr
