// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/export.h"

#include <ovradrcore/cache.h>
#include <ovradrcore/request.h>

#include <json/value.h>

#include <cstdint>
#include <string>

namespace OvraDRNode {

/// Whether a credential has the right to operate on its node: updated after every attempt over it;
/// the node is asked again after 3 seconds.
class OVRADRNODE_EXPORT CredPermissionCache : public OvraDRCore::Cache {
public:
    ~CredPermissionCache() override;
    Json::Value GetInfo() const override;
    [[nodiscard]] bool GetUpdatedData(Json::Value &value) const override;
    bool IsValid(const Json::Value &value) const override;
    bool IsUpdatedDataRequired() const override;

    explicit CredPermissionCache(const std::string &credId);

    /// A value that is not a verdict counts as having the right.
    bool HasPrivilege(const Json::Value &value) const;
    /// May ask the node.
    bool HasPrivilege() const;
    /// Never asks the node.
    bool GetCachedHasPrivilege() const;

    // These store a verdict; false if it could not be stored (an empty id never is).
    bool SetCacheData(bool has) const;
    bool SetHasPrivilege() const;
    /// \param request  the refused request; a relayed privilege test says nothing about this
    ///                 credential and is not stored
    bool SetNoPrivilege(const OvraDRCore::Request &request) const;
    bool SetPrivilege(const OvraDRCore::Request &request, bool has) const;
    /// As found by an attempt that began at `begun` (Now()): who was stopped in it has old news,
    /// which never replaces a younger verdict.
    bool SetPrivilege(const OvraDRCore::Request &request, bool has, std::int64_t begun) const;
    bool UpdateWithData(const Json::Value &value) const;
    bool UpdateWithData(const Json::Value &value, long start, long end) const;

private:
    bool isStorable(const OvraDRCore::Request &request, bool has) const;
    void logChange(const char *function, bool has) const;

    std::string credId;
};

} // namespace OvraDRNode
