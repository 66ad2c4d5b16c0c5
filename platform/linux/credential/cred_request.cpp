// SPDX-License-Identifier: Apache-2.0
#include "ovracredential/cred_request.h"

#include "credential/cred_objects.h"
#include "http/web_call.h"
#include "trust/peer_keys.h"

#include <ovrabase/secret.h>
#include <ovracore/ovracore.h>
#include <ovradrcore/log.h>

#include <array>
#include <chrono>
#include <exception>
#include <optional>
#include <utility>

namespace OVRA {

using OvraPlatform::CredError;
using OvraPlatform::CredExpected;
using OvraPlatform::Endpoint;
using OvraPlatform::WebReply;
using OvraPlatform::WireCall;

namespace {

constexpr long kDefaultSeconds = 60;
constexpr long kMaxSeconds = 24L * 60 * 60;
constexpr int kModeRequest = 0;
constexpr int kModeProbe = 2;
constexpr int kPlain = 0;
constexpr int kSealed = 2;
constexpr int kMaxHostName = 256;

/// Tells the node that grants this one a session what this one is called: it may hold no credential
/// with which it could ask.
void nameOwnHost(WireCall &call) {
    std::array<char, kMaxHostName> name{};
    if (call.api == "OVRA.DR.Node.Session" && call.method == "create" &&
        OVRALnxGetHostname(name.data(), kMaxHostName) > 0) {
        call.params["_hostname"] = name.data();
    }
}

} // namespace

struct CredRequest::Impl {
    std::optional<Endpoint> endpoint;
    std::string url;
    std::optional<WireCall> call;
    long seconds = kDefaultSeconds;
    int encryptMode = kPlain;
    std::optional<OvraPlatform::Upload> upload;
    std::string response;
    CredError error = CredError::kNone;

    ~Impl() { forgetCall(); }

    void forgetCall() {
        if (call) {
            OvraBase::wipe(call->sid);
        }
        call.reset();
    }

    /// Notes why an operation failed. \return 0, what the operation returns then
    int refuse(CredError why) {
        error = why;
        return 0;
    }

    int setTimeout(long wanted) {
        if (wanted < 1 || wanted > kMaxSeconds) {
            return refuse(CredError::kBadArgument);
        }
        seconds = wanted;
        return 1;
    }

    CredExpected<void> send(bool reuse, OvraPlatform::Deadline deadline) {
        if (!endpoint || !call) {
            return tl::unexpected(CredError::kBadArgument);
        }
        return OvraPlatform::callWebAPI(*endpoint, *call,
                                        {deadline, reuse, encryptMode == kSealed, upload})
            .map([this](WebReply reply) {
                response = std::move(reply.document);
                OvraDRCore::ReplyHandOver::give(response, std::move(reply.response));
            });
    }

    CredExpected<void> process(bool reuse, int mode) {
        const OvraPlatform::Deadline deadline =
            std::chrono::steady_clock::now() + std::chrono::seconds(seconds);
        switch (mode) {
        case kModeRequest:
            return send(reuse, deadline);
        case kModeProbe:
            if (endpoint) {
                return OvraPlatform::probe(*endpoint, url, deadline);
            }
            break;
        default:
            break;
        }
        return tl::unexpected(CredError::kBadArgument);
    }
};

CredRequest::CredRequest()
    : impl_(std::make_unique<Impl>()) {}

CredRequest::~CredRequest() = default;

int CredRequest::SetURL(const std::string &protocol, const std::string &address, int port,
                        const std::string &path) {
    try {
        auto endpoint = Endpoint::of(protocol, address, port);
        auto url = endpoint ? endpoint->url(path) : std::nullopt;
        if (!url) {
            return impl_->refuse(CredError::kBadArgument);
        }
        impl_->endpoint = std::move(endpoint);
        impl_->url = std::move(*url);
        return 1;
    } catch (const std::exception &) {
        return impl_->refuse(CredError::kOutOfMemory);
    }
}

int CredRequest::SetDefaultTimeout(long seconds) {
    return impl_->setTimeout(seconds);
}

int CredRequest::SetResponseTimeout(long seconds) {
    return impl_->setTimeout(seconds);
}

int CredRequest::SetEncryptMode(int mode) {
    if (mode != kPlain && mode != kSealed) {
        return impl_->refuse(CredError::kBadArgument);
    }
    impl_->encryptMode = mode;
    return 1;
}

int CredRequest::SetUploadFile(const std::string &path, const std::string &name) {
    if (path.empty() || name.empty()) {
        return impl_->refuse(CredError::kBadArgument);
    }
    try {
        impl_->upload = OvraPlatform::Upload{path, name};
        return 1;
    } catch (const std::exception &) {
        return impl_->refuse(CredError::kOutOfMemory);
    }
}

int CredRequest::CreateWebAPIRequest(CredRequest &req, OVRACred *cred, OVRACredSess *sess,
                                     const std::string &api, int version, const std::string &method,
                                     const Json::Value &params) {
    const bool callable = cred != nullptr && !api.empty() && version > 0 && !method.empty() &&
                          (params.isNull() || params.isObject());
    if (!callable ||
        req.SetURL(cred->protocol, cred->host, cred->port, OvraPlatform::kEntryPoint) == 0) {
        return req.impl_->refuse(CredError::kBadArgument);
    }
    try {
        req.impl_->forgetCall();
        WireCall &call = req.impl_->call.emplace();
        call.api = api;
        call.version = version;
        call.method = method;
        call.params = params;
        if (sess != nullptr) {
            call.sid = sess->token.get();
            OvraPlatform::nameOwnKeys(call.params);
            nameOwnHost(call);
        }
        return 1;
    } catch (const std::exception &) {
        return req.impl_->refuse(CredError::kOutOfMemory);
    }
}

int CredRequest::Process(bool reuse, int mode) {
    impl_->response.clear();
    try {
        const auto done = impl_->process(reuse, mode);
        impl_->error = done ? CredError::kNone : done.error();
    } catch (const std::exception &error) {
        OVRA_ERR("A request failed: [%s]", error.what());
        impl_->error = CredError::kOutOfMemory;
    }
    return impl_->error == CredError::kNone ? 1 : 0;
}

std::string CredRequest::GetResponse() const {
    return impl_->response;
}

int CredRequest::GetError() const {
    return static_cast<int>(impl_->error);
}

} // namespace OVRA
