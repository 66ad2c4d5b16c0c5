// SPDX-License-Identifier: Apache-2.0
#include "http/web_call.h"

#include "http/connection_pool.h"
#include "http/form_fields.h"
#include "ovraplatform/api_errors.h"
#include "seal/seal_key_cache.h"
#include "seal/sealing.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

#include <memory>
#include <utility>

namespace OvraPlatform {

namespace {

constexpr long kHttpOk = 200;
constexpr long kHttpUnauthorized = 401;
constexpr long kHttpForbidden = 403;
constexpr long kHttpNotFound = 404;
constexpr long kHttpServerError = 500;

WebReply failure(CredError error) {
    return {error, {}, {}};
}

/// What came as a reply, read here once for everybody.
WebReply readReply(std::string text) {
    OvraDRCore::Response response;
    response.setResp(text);
    return response.isValid() ? WebReply{CredError::kNone, std::move(text), std::move(response)}
                              : failure(CredError::kReplyBroken);
}

CredError errorOfStatus(long status) {
    if (status == kHttpUnauthorized || status == kHttpForbidden) {
        return CredError::kNoPermission;
    }
    return status == kHttpOk ? CredError::kNone : CredError::kHttpStatus;
}

/// One post to the entry point, over a kept connection when there is one.
HttpAnswer post(const Endpoint &endpoint, const WireCall &call, const WebCallOptions &options) {
    const auto url = endpoint.url(kEntryPoint);
    const auto fields = toFormFields(call);
    if (!url || !fields) {
        return {CredError::kBadArgument};
    }
    // From before the request: a key that is replaced while it runs ends the connection's life.
    const TrustStore::Stamp trust = TrustStore().stamp();
    std::unique_ptr<HttpConnection> connection;
    if (options.reuse) {
        connection = ConnectionPool::instance().take(endpoint, trust);
    }
    if (!connection) {
        connection = HttpConnection::open(endpoint, HttpConnection::Purpose::kRequests);
    }
    if (!connection) {
        return {CredError::kOutOfMemory};
    }
    HttpAnswer answer = options.upload
                            ? connection->postFile(*url, *fields, *options.upload, options.deadline)
                            : connection->post(*url, encodeForm(*fields), options.deadline);
    if (answer.error != CredError::kNone) {
        return answer;
    }
    if (options.reuse) {
        ConnectionPool::instance().keep(endpoint, trust, std::move(connection));
    }
    answer.error = errorOfStatus(answer.status);
    return answer;
}

WebReply callPlain(const Endpoint &endpoint, const WireCall &call, const WebCallOptions &options) {
    HttpAnswer answer = post(endpoint, call, options);
    if (answer.error != CredError::kNone) {
        return failure(answer.error);
    }
    return readReply(std::move(answer.body));
}

/// Over plain http the key itself has to be the one that was met first.
CredError judgeSealKey(const Endpoint &endpoint, const PublicKey &key) {
    TrustStore store;
    const std::string fingerprint = fingerprintOf(key);
    switch (store.pin(endpoint.key(), fingerprint)) {
    case TrustVerdict::kTrusted:
        return CredError::kNone;
    case TrustVerdict::kDifferent:
        OVRA_ERR("The key [%s] of [%s] is not the one trusted for it: find out why it changed, "
                 "then forget the old one",
                 fingerprint.c_str(), endpoint.key().c_str());
        return CredError::kCertificateChanged;
    default:
        return CredError::kTrustUnavailable;
    }
}

/// What an appliance says without the seal, because it could not open it.
bool isPlainRefusal(const OvraDRCore::Response &response) {
    switch (response.getErrCode()) {
    case APIError::kInternal:
    case APIError::kBadRequest:
    case APIError::kTooBusy:
    case APIError::kTooLarge:
        return response.isValid();
    default:
        return false;
    }
}

/// The reason of a refusal 109; "" for any other reply.
std::string sealRefusalReason(const OvraDRCore::Response &response) {
    return response.isValid() && response.getErrCode() == APIError::kSealRefused
               ? OvraDRCore::memberString(response.getErrMsg(), "reason")
               : std::string();
}

/// One call in a sealed envelope, with its two possible repetitions.
class SealedCall {
public:
    SealedCall(const Endpoint &endpoint, const WireCall &call, const WebCallOptions &options)
        : endpoint_(endpoint)
        , call_(call)
        , options_(options) {}

    WebReply run() {
        for (;;) {
            if (const CredError error = findKey(); error != CredError::kNone) {
                return failure(error);
            }
            WireCall outer;
            outer.api = call_.api;
            outer.version = call_.version;
            outer.method = call_.method;
            ReplyKey replyKey;
            outer.sealed =
                sealRequest(known_.key, call_, wallClock() + known_.clockOffset, replyKey);
            if (outer.sealed.empty()) {
                return failure(CredError::kSealFailed);
            }
            const HttpAnswer answer = post(endpoint_, outer, options_);
            if (answer.error != CredError::kNone) {
                return failure(answer.error);
            }
            std::optional<WebReply> reply = read(answer.body, replyKey);
            if (reply) {
                return *reply;
            }
        }
    }

private:
    CredError findKey() {
        const std::string key = endpoint_.key();
        if (const auto found = SealKeyCache::instance().find(key, TrustStore().stamp())) {
            known_ = *found;
            return CredError::kNone;
        }
        const FetchedKey fetched = fetchSealKey(endpoint_, options_);
        if (fetched.error != CredError::kNone) {
            return fetched.error;
        }
        if (!endpoint_.isTls()) {
            if (const CredError error = judgeSealKey(endpoint_, fetched.key);
                error != CredError::kNone) {
                return error;
            }
        }
        known_ = {fetched.key, known_.clockOffset};
        SealKeyCache::instance().put(key, TrustStore().stamp(), known_);
        return CredError::kNone;
    }

    /// The end of the call, or nothing when it has to be sent once more.
    std::optional<WebReply> read(const std::string &body, const ReplyKey &replyKey) {
        Json::Value reply;
        if (!OvraDRCore::fromString(reply, body) || !reply.isObject()) {
            return failure(CredError::kReplyBroken);
        }
        return reply.isMember("sealed_reply") ? readSealed(reply, replyKey)
                                              : readPlain(std::move(reply), body);
    }

    std::optional<WebReply> readSealed(const Json::Value &reply, const ReplyKey &replyKey) {
        std::optional<std::string> text = openReply(replyKey, reply);
        if (!text) {
            return failure(CredError::kSealFailed);
        }
        WebReply opened = readReply(std::move(*text));
        // Only a time that came sealed is believed: a wrong one would let somebody who holds the
        // request back deliver it later.
        if (!realigned_ && sealRefusalReason(opened.response) == "stale" &&
            realign(opened.response)) {
            realigned_ = true;
            return std::nullopt;
        }
        return opened;
    }

    std::optional<WebReply> readPlain(Json::Value &&document, const std::string &body) {
        OvraDRCore::Response response;
        response.setResp(std::move(document));
        if (!rekeyed_ && sealRefusalReason(response) == "key") {
            rekeyed_ = true;
            SealKeyCache::instance().drop(endpoint_.key());
            return std::nullopt;
        }
        return isPlainRefusal(response) ? WebReply{CredError::kNone, body, std::move(response)}
                                        : failure(CredError::kSealFailed);
    }

    /// \param refusal  one with a reason, so that its message is an object
    bool realign(const OvraDRCore::Response &refusal) {
        const Json::Value &time = refusal.getErrMsg()["time"];
        if (!time.isInt64()) {
            return false;
        }
        known_.clockOffset = time.asInt64() - wallClock();
        SealKeyCache::instance().put(endpoint_.key(), TrustStore().stamp(), known_);
        return true;
    }

    const Endpoint &endpoint_;
    const WireCall &call_;
    const WebCallOptions &options_;
    SealKeyCache::Known known_;
    bool realigned_ = false;
    bool rekeyed_ = false;
};

} // namespace

FetchedKey fetchSealKey(const Endpoint &endpoint, const WebCallOptions &options) {
    WireCall call;
    call.api = "OVRA.Core.Encryption";
    call.version = 1;
    call.method = "getinfo";
    WebCallOptions plain = options;
    plain.upload.reset();
    const WebReply reply = callPlain(endpoint, call, plain);
    if (reply.error != CredError::kNone) {
        return {reply.error};
    }
    const auto key = parsePublicKey(reply.response.getDataFieldtoStr("public_key"));
    if (!key) {
        OVRA_NOTICE("[%s] has no key to seal a request to", endpoint.key().c_str());
        return {CredError::kSealFailed};
    }
    return {CredError::kNone, *key};
}

WebReply callWebAPI(const Endpoint &endpoint, const WireCall &call, const WebCallOptions &options) {
    if (!endpoint.isTls() && options.upload) {
        OVRA_ERR("A file cannot be sealed: use an https endpoint to send it");
        return failure(CredError::kUploadUnreadable);
    }
    return endpoint.isTls() && !options.sealed ? callPlain(endpoint, call, options)
                                               : SealedCall(endpoint, call, options).run();
}

CredError probe(const Endpoint &endpoint, const std::string &url, Deadline deadline) {
    const auto connection = HttpConnection::open(endpoint, HttpConnection::Purpose::kProbe);
    if (!connection) {
        return CredError::kOutOfMemory;
    }
    const HttpAnswer answer = connection->get(url, deadline);
    if (answer.error != CredError::kNone) {
        return answer.error;
    }
    const bool answered = answer.status < kHttpServerError && answer.status != kHttpNotFound;
    return answered ? CredError::kNone : CredError::kHttpStatus;
}

} // namespace OvraPlatform
