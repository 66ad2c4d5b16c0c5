// SPDX-License-Identifier: Apache-2.0
#define OVRA_LOG_FILE "sender"
#include "transport/conn_cache.h"

#include "library_errors.h"
#include "paths.h"
#include "transport/request_scope.h"
#include "words.h"

#include <ovracredential/cred_request.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

#include <ctime>

namespace OvraDRNode {

namespace {

constexpr long kLifetime = 5;      // seconds
constexpr long kProbeTimeout = 10; // seconds
constexpr int kReadAttempts = 3;
constexpr int kProbe = 2;

std::string entryName(const Conn &conn) {
    return "conn_" + conn.protocol + "_" + std::to_string(conn.port) + "_" + conn.addr;
}

std::string text(const Conn &conn) {
    return OvraDRCore::toString(conn.toJson());
}

const char *word(bool verdict) {
    return verdict ? "true" : "false";
}

} // namespace

ProbeResult IsConnectableWithErrCheck(const Conn &conn) {
    OVRA::CredRequest request;
    const std::time_t start = std::time(nullptr);
    if (request.SetURL(conn.protocol, conn.addr, conn.port, Path::kWebEntryPoint) == 0) {
        OVRA_ERR("Failed to set url of conn [%s]", text(conn).c_str());
        return {false, false};
    }
    if (request.SetDefaultTimeout(kProbeTimeout) == 0) {
        OVRA_ERR("Failed to set timeout of conn [%s]", text(conn).c_str());
        return {false, false};
    }
    if (request.Process(true, kProbe) != 0) {
        return {true, true};
    }
    OVRA_DEBUG("Detect conn [%s] disconnect costs [%.f]sec", conn.addr.c_str(),
               std::difftime(std::time(nullptr), start));
    OVRA_NOTICE("Conn [%s] is not connectable since cred error[%d]", text(conn).c_str(),
                request.GetError());
    if (request.GetError() == LibraryError::kOutOfMemory) {
        return {false, true, true};
    }
    RequestScope::noteUnreachable(conn);
    return {false, true};
}

ConnCache::ConnCache(const Conn &conn_)
    : Cache(Path::kConnCache, entryName(conn_), kLifetime, false, kReadAttempts)
    , conn(conn_) {}

ConnCache::~ConnCache() = default;

Json::Value ConnCache::GetInfo() const {
    Json::Value info(Json::objectValue);
    info[Word::kName] = "conn cache";
    info[Word::kConn] = conn.toJson();
    return info;
}

bool ConnCache::getStoredVerdict() const {
    const Json::Value stored = GetCachedData();
    return !IsValid(stored) || stored.asBool();
}

bool ConnCache::isHeldUnreachable() const {
    const double age = GetCachedAge();
    return age >= 0 && age <= static_cast<double>(kLifetime) && !getStoredVerdict();
}

void ConnCache::logChange(const char *function, bool oldVerdict, bool newVerdict) const {
    if (oldVerdict != newVerdict) {
        OVRA_LOG_IN(OvraDRCore::LogLevel::kNotice, function,
                    "Update conn cache [%s] from [%s] to [%s]", text(conn).c_str(),
                    word(oldVerdict), word(newVerdict));
    }
}

bool ConnCache::GetUpdatedData(Json::Value &value) const {
    const ProbeResult probe = IsConnectableWithErrCheck(conn);
    value = probe.connectable;
    const bool old = getStoredVerdict();
    if (!probe.ran || probe.lacked) {
        return false;
    }
    logChange(__func__, old, probe.connectable);
    return true;
}

bool ConnCache::IsValid(const Json::Value &value) const {
    return value.isBool();
}

bool ConnCache::IsUpdatedDataRequired() const {
    return getStoredVerdict();
}

} // namespace OvraDRNode
