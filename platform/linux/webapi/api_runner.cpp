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

Json::Value failure(const std::string &text) {
    return apiError(APIError::kInternal, text);
}

/// Connects to the daemon; nothing, with the reason in `why`, when nobody answers.
UniqueFd connectToDaemon(OvraPlatform::Deadline deadline, std::string &why) {
    const std::string path = OvraPlatform::kSocketFile;
    const std::optional<sockaddr_un> address = OvraPlatform::localAddress(path);
    UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!address || !fd) {
        why = "no socket for asking the daemon: " + OvraBase::errnoText(errno);
        return {};
    }
    while (!OvraPlatform::connectLocal(fd.get(), *address)) {
        // The queue of callers is full: the only case that passes by waiting.
        if (errno == EAGAIN && std::chrono::steady_clock::now() < deadline) {
            std::this_thread::sleep_for(kRetryPause);
            continue;
        }
        if (errno == EACCES || errno == EPERM) {
            why = "ovradrd may not be asked by this user: run the command as root";
        } else {
            why = "ovradrd does not answer on " + path + " (" + OvraBase::errnoText(errno) +
                  "): start it";
        }
        return {};
    }
    if (!OvraPlatform::isPeerTrusted(fd.get())) {
        why = "the process that answers on " + path + " is neither root's nor this user's: stop it";
        return {};
    }
    return fd;
}

bool askDaemon(Json::Value &out, const OvraPlatform::LocalCall &call) {
    const auto deadline = std::chrono::steady_clock::now() + kCallTime;
    std::string why;
    const UniqueFd fd = connectToDaemon(deadline, why);
    if (!fd) {
        out = failure(why);
        return false;
    }
    const std::string request = OvraPlatform::toLocalRequest(call);
    if (request.size() > OvraPlatform::kMaxFrame) {
        out = apiError(APIError::kTooLarge, "the request is too large: send less at once");
        return false;
    }
    // A daemon that refuses us answers without reading: sending fails then, and the answer is
    // there.
    OvraPlatform::sendFrame(fd.get(), request, deadline);
    const std::optional<std::string> reply = OvraPlatform::receiveFrame(fd.get(), deadline);
    if (!reply) {
        out = failure("ovradrd gave no answer, or none in time: its log says why");
        return false;
    }
    Json::Value document;
    if (!OvraDRCore::fromString(document, *reply) || !document.isObject()) {
        out = failure("ovradrd gave an answer that is not a document: is it the same version?");
        return false;
    }
    out = std::move(document);
    return true;
}

bool runHere(Json::Value &out, const OvraPlatform::LocalCall &call,
             const OvraPlatform::APIRegistry &registry) {
    OvraPlatform::APICaller caller;
    caller.user = call.user;
    caller.administrator = true;
    caller.local = true;
    out = registry.dispatch(call, caller);
    return true;
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
        return registry != nullptr ? runHere(out, call, *registry) : askDaemon(out, call);
    } catch (const std::exception &error) {
        out = failure(std::string("the call failed: ") + error.what());
        return false;
    }
}

bool APIValidator::IsPort(const int &port) {
    return port >= 1 && port <= 65535;
}

} // namespace OVRA
