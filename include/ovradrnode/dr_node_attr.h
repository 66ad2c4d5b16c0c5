// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/export.h"

#include <json/value.h>

#include <string>

namespace OvraDRNode {

/// A text that an application stores about a node: one value for each (node id, application, name).
class OVRADRNODE_EXPORT DRNodeAttr {
public:
    DRNodeAttr() = default;
    DRNodeAttr(const std::string &nodeId, const std::string &app, const std::string &attr,
               const std::string &value);
    DRNodeAttr(const DRNodeAttr &) = default;
    DRNodeAttr &operator=(const DRNodeAttr &) = default;

    /// Node id, application and name are set; the value may be empty.
    bool isValid() const;
    /// Members "node_id", "app", "attr" and "value".
    Json::Value toJson() const;

    std::string nodeId;
    std::string app;
    std::string attr;
    std::string value;
};

} // namespace OvraDRNode
