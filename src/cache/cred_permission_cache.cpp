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

/// \param function  the function name in the log line
void CredPermissionCache::logChange(const char *function, bool has) const {
    const bool old = GetCachedHasPrivilege();
    if (old != has) {
        OVRA_LOG_IN(OvraDRCore::LogLevel::kNotice, function,
                    "Set cred [%s] permission cache from [%s] to [%s]", credId.c_str(), word(old),
                    word(has));
    }
}

bool CredPermissionCache::SetCacheData(bool has) const {
    if (credId.empty()) {
        return false;
    }
    logChange(__func__, has);
    return UpdateWithData(has);
}

bool CredPermissionCache::SetHasPrivilege() const {
    return SetCacheData(true);
}

/// Whether what was found of the request says something about this credential.
bool CredPermissionCache::isStorable(const OvraDRCore::Request &request, bool has) const {
    if (credId.empty()) {
        return false;
    }
    if (!has && WebAPI::isRelayTestPrivilegeAPI(request)) {
        OVRA_LOG_IN(OvraDRCore::LogLevel::kNotice, "SetNoPrivilege",
                    "Not update no permission of credId[%s] in cache for relay test privilege "
                    "request",
                    credId.c_str());
        return false;
    }
    return true;
}

bool CredPermissionCache::SetNoPrivilege(const OvraDRCore::Request &request) const {
    return isStorable(request, false) && SetCacheData(false);
}

bool CredPermissionCache::SetPrivilege(const OvraDRCore::Request &request, bool has) const {
    return has ? SetHasPrivilege() : SetNoPrivilege(request);
}

bool CredPermissionCache::SetPrivilege(const OvraDRCore::Request &request, bool has,
                                       std::int64_t begun) const {
    if (!isStorable(request, has)) {
        return false;
    }
    logChange("SetCacheData", has);
    return UpdateWithFinding(has, begun);
}

bool CredPermissionCache::UpdateWithData(const Json::Value &value) const {
    return !credId.empty() && Cache::UpdateWithData(value);
}

bool CredPermissionCache::UpdateWithData(const Json::Value &value, long start, long end) const {
    return !credId.empty() && Cache::UpdateWithData(value, start, end);
}

} // namespace OvraDRNode
