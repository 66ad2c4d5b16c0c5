// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/export.h"

#include <ovradrcore/cache.h>

#include <json/value.h>

#include <string>

namespace OvraDRNode {

/// A node's facts about itself (host name, serial number, time zone), refreshed after 60 seconds (5
/// for the local node). For an unreachable node the last known facts stay.
class OVRADRNODE_EXPORT NodeCache : public OvraDRCore::Cache {
public:
    ~NodeCache() override;
    Json::Value GetInfo() const override;
    [[nodiscard]] bool GetUpdatedData(Json::Value &value) const override;
    bool IsValid(const Json::Value &value) const override;

    /// \param flag  whether a reader waits for a refresh by another process; always for the local
    ///              node
    NodeCache(const std::string &nodeId, bool flag);

    // Each is "" if unknown; may ask the node.
    std::string GetHostName() const;
    std::string GetSerialNum() const;
    std::string GetTimeZone() const;

    /// Seconds since the node said what is stored, which may be longer ago than it was asked last;
    /// -1 if unknown. Sends nothing.
    double GetLearntAge() const;
    /// Stores what the node has just said.
    bool Learn(const Json::Value &facts) const;

private:
    std::string nodeId;
};

} // namespace OvraDRNode
