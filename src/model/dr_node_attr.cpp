// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/dr_node_attr.h"

#include "words.h"

namespace OvraDRNode {

DRNodeAttr::DRNodeAttr(const std::string &nodeId_, const std::string &app_,
                       const std::string &attr_, const std::string &value_)
    : nodeId(nodeId_)
    , app(app_)
    , attr(attr_)
    , value(value_) {}

bool DRNodeAttr::isValid() const {
    return !nodeId.empty() && !app.empty() && !attr.empty();
}

Json::Value DRNodeAttr::toJson() const {
    Json::Value json(Json::objectValue);
    json[Word::kNodeId] = nodeId;
    json[Word::kApp] = app;
    json[Word::kAttr] = attr;
    json[Word::kValue] = value;
    return json;
}

} // namespace OvraDRNode
