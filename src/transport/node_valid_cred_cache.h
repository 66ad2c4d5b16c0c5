// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrcore/cache.h>

#include <json/value.h>

#include <string>

namespace OvraDRNode {

/// The id of the credential that last worked for a node; searched for again after 5 seconds.
class NodeValidCredCache : public OvraDRCore::Cache {
public:
    ~NodeValidCredCache() override;
    Json::Value GetInfo() const override;
    /// Keeps the stored credential while it has the right, otherwise finds one that has.
    bool GetUpdatedData(Json::Value &value) const override;
    bool IsValid(const Json::Value &value) const override;
    bool IsUpdatedDataRequired() const override;

    explicit NodeValidCredCache(const std::string &nodeId);

    /// The stored id, however old; "" if there is none.
    std::string getStoredCredId() const;

private:
    std::string nodeId;
};

} // namespace OvraDRNode
