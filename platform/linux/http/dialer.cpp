// SPDX-License-Identifier: Apache-2.0
#include "http/dialer.h"

#include "ovraplatform/appliance.h"
#include "relay/alias_place.h"

#include <ovradrcore/cache.h>
#include <ovradrcore/log.h>
#include <ovradrcore/no_fork.h>

#include <algorithm>
#include <cerrno>
#include <utility>
#include <vector>

namespace OvraPlatform {

namespace {

constexpr long kLifetime = 24L * 60 * 60; // seconds
constexpr int kReadAttempts = 3;

/// The address of a host with several at which it was reached last. It only decides which one is
/// tried first.
class AddressCache : public OvraDRCore::Cache {
public:
    explicit AddressCache(const Endpoint &endpoint)
        : Cache(std::string(kCacheDir) + "/dr_address_cache", endpoint.key(), kLifetime, false,
                kReadAttempts) {}

    Json::Value GetInfo() const override {
        Json::Value info(Json::objectValue);
        info["name"] = "address cache";
        return info;
    }
    bool GetUpdatedData(Json::Value &) const override { return false; } // connecting stores it
    bool IsValid(const Json::Value &value) const override { return value.isString(); }
};

OvraBase::Expected<std::vector<OvraBase::SocketAddress>> resolve(const Endpoint &endpoint,
                                                                 OvraBase::Deadline deadline) {
    const OvraDRCore::NoFork::Pause forksPass;
    return OvraBase::resolveHost(endpoint.host(), endpoint.port(), deadline);
}

CredError errorOf(const OvraBase::Error &error) {
    if (OvraBase::isShortage(error.number)) {
        return CredError::kOutOfMemory;
    }
    return error.number == ETIMEDOUT ? CredError::kTimedOut : CredError::kCannotConnect;
}

CredExpected<OvraBase::UniqueFd> dialDirectly(const Endpoint &endpoint,
                                              OvraBase::Deadline deadline) {
    using OvraBase::SocketAddress;
    const AddressCache cache(endpoint);
    std::string last;
    bool several = false;
    return resolve(endpoint, deadline)
        .and_then([&](std::vector<SocketAddress> addresses) {
            several = addresses.size() > 1;
            if (several) {
                const Json::Value stored = cache.GetCachedData();
                last = cache.IsValid(stored) ? stored.asString() : "";
                std::stable_partition(addresses.begin(), addresses.end(),
                                      [&last](const SocketAddress &each) {
                                          return OvraBase::addressText(each.get()) == last;
                                      });
            }
            const OvraDRCore::NoFork::Pause forksPass;
            return OvraBase::connectFirst(std::move(addresses), deadline);
        })
        .map([&](OvraBase::Connection connection) {
            const std::string address = OvraBase::addressText(connection.peer.get());
            if (several && address != last) {
                cache.UpdateWithData(address);
            }
            return std::move(connection.socket);
        })
        .map_error([&endpoint](const OvraBase::Error &error) {
            OVRA_INFO("No connection to [%s]: [%s]", endpoint.key().c_str(), error.text.c_str());
            return errorOf(error);
        });
}

} // namespace

CredExpected<OvraBase::UniqueFd> dial(const Endpoint &endpoint, OvraBase::Deadline deadline) {
    const std::string alias = endpoint.alias();
    if (alias.empty()) {
        return dialDirectly(endpoint, deadline);
    }
    return findAlias(alias, deadline).and_then([deadline](const Endpoint &place) {
        return dialDirectly(place, deadline);
    });
}

} // namespace OvraPlatform
