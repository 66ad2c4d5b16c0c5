// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/cred_permission_cache.h"

#include "library_errors.h"
#include "ovradrnode/node_api.h"
#include "ovradrnode/sender.h"
#include "paths.h"
#include "words.h"

#include <ovradrcore/log.h>

namespace OvraDRNode {

namespace {

constexpr long kLifetime = 3; // seconds
constexpr int kReadAttempts = 3;

const char *word(bool verdict) {
    return verdict ? "true" : "false";
}

} // namespace

CredPermissionCache::CredPermissionCache(const std::string &credId_)
    : Cache(Path::kPermissionCache, "cred_permission_" + credId_, kLifetime, false, kReadAttempts)
    , credId(credId_) {}

CredPermissionCache::~CredPermissionCache() = default;

Json::Value CredPermissionCache::GetInfo() const {
    Json::Value info(Json::objectValue);
    info[Word::kName] = "cred permission cache";
    info[Word::kCredId] = credId;
    return info;
}

bool CredPermissionCache::GetUpdatedData(Json::Value &value) const {
    if (credId.empty()) {
        return false;
    }
    CredNodeSender sender(credId);
    value = sender.process(WebAPI::getDRNodeTestPrivilegeAPI()).isSuccess();
    return sender.GetErrCode() != OvraDRCore::ERR::kCredLibrary ||
           sender.GetErrMsg() != LibraryError::kOutOfMemory; // that says nothing about the right
}

bool CredPermissionCache::IsValid(const Json::Value &value) const {
    return value.isBool();
}

bool CredPermissionCache::IsUpdatedDataRequired() const {
    return true;
}

bool CredPermissionCache::HasPrivilege(const Json::Value &value) const {
    return !IsValid(value) || value.asBool();
}

bool CredPermissionCache::HasPrivilege() const {
    return HasPrivilege(Read());
}

bool CredPermissionCache::GetCachedHasPrivilege() const {
    return HasPrivilege(GetCachedData());
}

bool CredPermissionCache::SetCacheData(bool has) const {
    if (credId.empty()) {
        return false;
    }
    const bool old = GetCachedHasPrivilege();
    if (old != has) {
        OVRA_NOTICE("Set cred [%s] permission cache from [%s] to [%s]", credId.c_str(), word(old),
                    word(has));
    }
    return UpdateWithData(has);
}

bool CredPermissionCache::SetHasPrivilege() const {
    return SetCacheData(true);
}

bool CredPermissionCache::SetNoPrivilege(const OvraDRCore::Request &request) const {
    if (credId.empty()) {
        return false;
    }
    if (WebAPI::isRelayTestPrivilegeAPI(request)) {
        OVRA_NOTICE("Not update no permission of credId[%s] in cache for relay test privilege "
                    "request",
                    credId.c_str());
        return false;
    }
    return SetCacheData(false);
}

bool CredPermissionCache::SetPrivilege(const OvraDRCore::Request &request, bool has) const {
    return has ? SetHasPrivilege() : SetNoPrivilege(request);
}

bool CredPermissionCache::UpdateWithData(const Json::Value &value) const {
    return !credId.empty() && Cache::UpdateWithData(value);
}

bool CredPermissionCache::UpdateWithData(const Json::Value &value, long start, long end) const {
    return !credId.empty() && Cache::UpdateWithData(value, start, end);
}

} // namespace OvraDRNode
