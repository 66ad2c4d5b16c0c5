// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <map>
#include <set>
#include <string>
#include <vector>

namespace OvraApps {

/// Under which our own programs keep attributes of nodes.
inline constexpr char kOwnApplication[] = "ovradr";
/// What a person calls the node on this appliance.
inline constexpr char kNameAttr[] = "name";
/// What a person notes about it.
inline constexpr char kCommentAttr[] = "comment";
/// The host name that it gave when it was last granted a session here.
inline constexpr char kHostNameAttr[] = "hostname";

/// What is known of a node besides its id; "" where nothing is.
struct NodeName {
    std::string given;   ///< by a person, on this appliance
    std::string host;    ///< its own host name, as it last told
    std::string comment; ///< of a person, on this appliance

    /// What people are shown; "" if the node has no name.
    const std::string &shown() const { return given.empty() ? host : given; }
    /// Whether a person means this node by `text`; case does not count.
    bool matches(const std::string &text) const;
};

/// The names of nodes, as the node database and the caches have them: one statement and one reading
/// of a cache file, however many nodes. Sends nothing.
class NodeNames {
public:
    /// \param ids  the nodes whose host names may be asked for, beside those with attributes
    explicit NodeNames(const std::set<std::string> &ids);

    const NodeName &of(const std::string &nodeId) const;
    /// The nodes that have attributes, whether or not anything else is known of them.
    const std::set<std::string> &named() const { return named_; }

private:
    std::map<std::string, NodeName> names_;
    std::set<std::string> named_;
};

/// What is wrong with a name that a person wants to give; "" if it is fine. A name has 1 to 63
/// bytes of UTF-8 that a terminal shows as they are, no blank, and could not be taken for an
/// option, a URL or the word "local".
std::string nodeNameProblem(const std::string &name);

} // namespace OvraApps
