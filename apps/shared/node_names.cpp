// SPDX-License-Identifier: Apache-2.0
#include "shared/node_names.h"

#include <ovrabase/address.h>
#include <ovrabase/utf8.h>
#include <ovradrcore/json.h>
#include <ovradrnode/node_cache.h>
#include <ovradrnode/node_db.h>

namespace OvraApps {

using OvraDRNode::DRNode;
using OvraDRNode::DRNodeAttr;
using OvraDRNode::NodeCache;

bool NodeName::matches(const std::string &text) const {
    const std::string wanted = OvraBase::toLower(text);
    return !wanted.empty() &&
           (wanted == OvraBase::toLower(given) || wanted == OvraBase::toLower(host));
}

NodeNames::NodeNames(const std::set<std::string> &ids) {
    std::vector<DRNodeAttr> attrs;
    (void)OvraDRNode::DRNodeDB::ListAppAttr(kOwnApplication, attrs); // the log says why not
    std::set<std::string> all = ids;
    for (const DRNodeAttr &attr : attrs) {
        NodeName &name = names_[attr.nodeId];
        std::string *const place = attr.attr == kNameAttr       ? &name.given
                                   : attr.attr == kCommentAttr  ? &name.comment
                                   : attr.attr == kHostNameAttr ? &name.host
                                                                : nullptr;
        if (place != nullptr && !attr.value.empty()) {
            *place = attr.value;
            named_.insert(attr.nodeId);
            all.insert(attr.nodeId);
        }
    }
    const OvraDRCore::CacheSnapshotScope snapshot;
    for (const std::string &id : all) {
        const std::string host =
            DRNode::isLocalNodeId(id)
                ? DRNode::getLocalHostName()
                : OvraDRCore::memberString(NodeCache(id, false).GetCachedData(), "hostname");
        if (!host.empty()) {
            names_[id].host = host;
        }
    }
}

const NodeName &NodeNames::of(const std::string &nodeId) const {
    static const NodeName kNone;
    const auto found = names_.find(nodeId);
    return found == names_.end() ? kNone : found->second;
}

std::string nodeNameProblem(const std::string &name) {
    constexpr std::size_t kMaxName = 63;
    if (name.empty() || name.size() > kMaxName) {
        return "a name has 1 to 63 bytes";
    }
    if (name.find(' ') != std::string::npos || OvraBase::shown(name) != name) {
        return "a name has no blanks and no characters that do not show";
    }
    if (name.front() == '-' || OvraBase::toLower(name) == "local" ||
        name.find("://") != std::string::npos || name.starts_with("flk:")) {
        return "it would be taken for something else";
    }
    return "";
}

} // namespace OvraApps
