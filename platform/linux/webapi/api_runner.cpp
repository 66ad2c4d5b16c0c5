// SPDX-License-Identifier: Apache-2.0
#include "ovrawebapi/api_runner.h"

#include "ovraplatform/api_errors.h"
#include "ovraplatform/api_registry.h"
#include "ovraplatform/appliance.h"
#include "webapi/local_address.h"
#include "webapi/local_wire.h"

#include <ovrabase/file.h>
#include <ovrabase/unique_fd.h>
#include <ovradrcore/json.h>

#include <sys/socket.h>

#include <cerrno>
#include <chrono>
#include <exception>
#include <optional>
#include <string>
#include <thread>
#include <utility>

namespace {

using OvraBase::UniqueFd;
using OvraPlatform::apiError;
namespace APIError = OvraPlatform::APIError;

/// Bound on a call, whatever it waits for on the network.
constexpr std::chrono::seconds kCallTime{120};
constexpr std::chrono::milliseconds kRetryPause{10};

/// An answer, or the document that says why there is none.
using Answer = tl::expected<Json::Value, Json::Value>;

tl::unexpected<Json::Value> failure(const std::string &text) {
    return tl::unexpected(apiError(APIError::kInternal, text));
}

/// Connects to the daemon, or says why it is not asked.
tl::expected<UniqueFd, std::string> connectToDaemon(OvraPlatform::Deadline deadline) {
    const std::string path = OvraPlatform::kSocketFile;
    const std::optional<sockaddr_un> address = OvraPlatform::localAddress(path);
    UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!address || !fd) {
        return tl::unexpected("no socket for asking the daemon: " + OvraBase::errnoText(errno));
    }
    while (!OvraPlatform::connectLocal(fd.get(), *address)) {
        // The queue of callers is full: the only case that passes by waiting.
        if (errno == EAGAIN && std::chrono::steady_clock::now() < deadline) {
            std::this_thread::sleep_for(kRetryPause);
            continue;
        }
        if (errno == EACCES || errno == EPERM) {
            return tl::unexpected(
                std::string("ovradrd may not be asked by this user: run the command as root"));
        }
        return tl::unexpected("ovradrd does not answer on " + path + " (" +
                              OvraBase::errnoText(errno) + "): start it");
    }
    if (!OvraPlatform::isPeerTrusted(fd.get())) {
        return tl::unexpected("the process that answers on " + path +
                              " is neither root's nor this user's: stop it");
    }
    return fd;
}

Answer askDaemon(const OvraPlatform::LocalCall &call) {
    const auto deadline = std::chrono::steady_clock::now() + kCallTime;
    const auto fd = connectToDaemon(deadline);
    if (!fd) {
        return failure(fd.error());
    }
    const std::string request = OvraPlatform::toLocalRequest(call);
    if (request.size() > OvraPlatform::kMaxFrame) {
        return tl::unexpected(
            apiError(APIError::kTooLarge, "the request is too large: send less at once"));
    }
    // A daemon that refuses us answers without reading: sending fails then, and the answer is
    // there.
    (void)OvraPlatform::sendFrame(fd->get(), request, deadline);
    const std::optional<std::string> reply = OvraPlatform::receiveFrame(fd->get(), deadline);
    if (!reply) {
        return failure("ovradrd gave no answer, or none in time: its log says why");
    }
    Json::Value document;
    if (!OvraDRCore::fromString(document, *reply) || !document.isObject()) {
        return failure("ovradrd gave an answer that is not a document: is it the same version?");
    }
    return document;
}

Json::Value runHere(const OvraPlatform::LocalCall &call,
                    const OvraPlatform::APIRegistry &registry) {
    OvraPlatform::APICaller caller;
    caller.user = call.user;
    caller.role = OvraPlatform::Role::kAdministrator;
    caller.local = true;
    return registry.dispatch(call, caller);
}

} // namespace

namespace OVRA {

APIRunner::APIRunner() = default;
APIRunner::~APIRunner() = default;

bool APIRunner::Exec(Json::Value &out, const char *api, int version, const char *method,
                     const Json::Value &params, const char *user) {
    try {
        if (api == nullptr || method == nullptr || user == nullptr || *user == '\0') {
            out = apiError(APIError::kBadRequest, "a call needs an API, a method and a user");
            return false;
        }
        const OvraPlatform::LocalCall call{{api, version, method, params}, user};
        const OvraPlatform::APIRegistry *registry = OvraPlatform::APIRegistry::hosted();
        const Answer answer = registry != nullptr ? runHere(call, *registry) : askDaemon(call);
        out = answer ? *answer : answer.error();
        return answer.has_value();
    } catch (const std::exception &error) {
        out = failure(std::string("the call failed: ") + error.what()).value();
        return false;
    }
}

bool APIValidator::IsPort(const int &port) {
    return port >= 1 && port <= 65535;
}

} // namespace OVRA
