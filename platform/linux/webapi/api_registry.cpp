// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/api_registry.h"

#include "ovraplatform/api_errors.h"

#include <ovradrcore/log.h>

#include <atomic>
#include <exception>
#include <utility>

namespace OvraPlatform {

namespace {

std::atomic<const APIRegistry *> hostedRegistry{nullptr};

bool isReplyDocument(const Json::Value &reply) {
    return reply.isObject() && reply["success"].isBool();
}

Json::Value runHandler(const APIHandler &handler, const APICall &call, const APICaller &caller) {
    try {
        static const Json::Value kNoParams(Json::objectValue);
        Json::Value reply = handler(call.params.isNull() ? kNoParams : call.params, caller);
        if (isReplyDocument(reply)) {
            return reply;
        }
        OVRA_ERR("The handler of [%s] method [%s] returned no reply document", call.api.c_str(),
                 call.method.c_str());
    } catch (const std::exception &error) {
        OVRA_ERR("The handler of [%s] method [%s] failed: [%s]", call.api.c_str(),
                 call.method.c_str(), error.what());
    } catch (...) {
        OVRA_ERR("The handler of [%s] method [%s] failed", call.api.c_str(), call.method.c_str());
    }
    return apiError(APIError::kInternal, "the call failed on the appliance: see its log");
}

const char *refusalText(int code) {
    switch (code) {
    case APIError::kNoSuchAPI:
        return "the appliance has no such API: check the name, or update the appliance";
    case APIError::kNoSuchMethod:
        return "the API has no such method: check the name, or update the appliance";
    default:
        return "the method has no such version: check the number, or update the appliance";
    }
}

} // namespace

APIRegistry::~APIRegistry() {
    const APIRegistry *self = this;
    hostedRegistry.compare_exchange_strong(self, nullptr);
}

void APIRegistry::add(const std::string &api, int version, const std::string &method,
                      APIRight right, APIQueue queue, APIHandler handler, APIQueueChoice choice) {
    apis_[api][method].insert_or_assign(version,
                                        Entry{right, queue, std::move(handler), std::move(choice)});
}

tl::expected<const APIRegistry::Entry *, int> APIRegistry::find(const APICall &call) const {
    const auto methods = apis_.find(call.api);
    if (methods == apis_.end()) {
        return tl::unexpected<int>(APIError::kNoSuchAPI);
    }
    const auto versions = methods->second.find(call.method);
    if (versions == methods->second.end()) {
        return tl::unexpected<int>(APIError::kNoSuchMethod);
    }
    const auto entry = versions->second.find(call.version);
    if (entry == versions->second.end()) {
        return tl::unexpected<int>(APIError::kNoSuchVersion);
    }
    return &entry->second;
}

std::vector<APIRegistry::Method> APIRegistry::methods() const {
    std::vector<Method> all;
    for (const auto &[api, methods] : apis_) {
        for (const auto &[method, versions] : methods) {
            for (const auto &[version, entry] : versions) {
                all.push_back({api, version, method, entry.right, entry.queue});
            }
        }
    }
    return all;
}

APIQueue APIRegistry::queue(const APICall &call) const {
    const auto entry = find(call);
    if (!entry) {
        return APIQueue::kQuick;
    }
    return (*entry)->choice ? (*entry)->choice(call.params) : (*entry)->queue;
}

std::optional<Json::Value> APIRegistry::refusal(const APICall &call,
                                                const APICaller &caller) const {
    const auto found = find(call);
    if (!found) {
        return apiError(found.error(), refusalText(found.error()));
    }
    const Entry *const entry = *found;
    if (entry->right != APIRight::kNone && caller.user.empty()) {
        return apiError(APIError::kNoSession, "the session is unknown or expired: log in again");
    }
    if (entry->right == APIRight::kPairing && caller.role < Role::kPairing) {
        return apiError(APIError::kNoPermission, "the call needs the right to pair: use an account "
                                                 "with the role pairing or administrator");
    }
    if (entry->right == APIRight::kAdministrator && caller.role != Role::kAdministrator) {
        return apiError(APIError::kNoPermission,
                        "the call needs an administrator: use an administrator's account");
    }
    if (entry->right == APIRight::kLocal && !caller.local) {
        return apiError(APIError::kNoPermission,
                        "the call is for the appliance's own processes: make it on the appliance");
    }
    return std::nullopt;
}

Json::Value APIRegistry::dispatch(const APICall &call, const APICaller &caller) const {
    if (std::optional<Json::Value> refused = refusal(call, caller)) {
        return *std::move(refused);
    }
    if (!call.params.isNull() && !call.params.isObject()) {
        return apiError(APIError::kBadRequest, "the parameters are not an object");
    }
    return runHandler((*find(call))->handler, call, caller);
}

void APIRegistry::host() {
    hostedRegistry = this;
}

const APIRegistry *APIRegistry::hosted() {
    return hostedRegistry;
}

} // namespace OvraPlatform
