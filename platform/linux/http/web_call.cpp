// SPDX-License-Identifier: Apache-2.0
#include "http/web_call.h"

#include "http/connection_pool.h"
#include "http/form_fields.h"
#include "ovraplatform/api_errors.h"
#include "seal/seal_key_cache.h"
#include "seal/sealing.h"
#include "trust/peer_keys.h"

#include <ovrabase/secret.h>
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

/// Parses a reply; what it may make us do is bounded, because a peer wrote it.
CredExpected<Json::Value> parseReply(const std::string &text) {
    Json::Value document;
    switch (const OvraDRCore::JsonFault fault = OvraDRCore::parseJson(document, text)) {
    case OvraDRCore::JsonFault::kNone:
        return document;
    case OvraDRCore::JsonFault::kNotJson:
        return tl::unexpected(CredError::kReplyBroken);
    default:
        OVRA_NOTICE("A reply of [%zu] bytes is refused, because it %s", text.size(),
                    OvraDRCore::describe(fault));
        return tl::unexpected(CredError::kReplyTooLarge);
    }
}

/// What came as a reply, parsed once for all callers.
CredExpected<WebReply> readReply(std::string text) {
    CredExpected<Json::Value> document = parseReply(text);
    if (!document) {
        return tl::unexpected(document.error());
    }
    OvraDRCore::Response response;
    response.setResp(*std::move(document));
    if (!response.isValid()) {
        return tl::unexpected(CredError::kReplyBroken);
    }
    return WebReply{std::move(text), std::move(response)};
}

/// The body, if the status says that it is the answer.
CredExpected<std::string> bodyOf(HttpAnswer answer) {
    if (answer.status == kHttpOk) {
        return std::move(answer.body);
    }
    const bool denied = answer.status == kHttpUnauthorized || answer.status == kHttpForbidden;
    return tl::unexpected(denied ? CredError::kNoPermission : CredError::kHttpStatus);
}

/// One post to the entry point, over a kept connection if there is one.
CredExpected<std::string> post(const Endpoint &endpoint, const WireCall &call,
                               const WebCallOptions &options) {
    const auto url = endpoint.url(kEntryPoint);
    auto fields = toFormFields(call);
    if (!url || !fields) {
        return tl::unexpected(CredError::kBadArgument);
    }
    // From before the request: a key that is replaced while it runs ends the connection's life.
    const TrustStore::Stamp trust = TrustStore().stamp();
    std::unique_ptr<HttpConnection> connection;
    if (options.reuse) {
        connection = ConnectionPool::instance().take(endpoint, trust);
    }
    if (!connection) {
        connection = HttpConnection::open(endpoint, options.firstContact
                                                        ? HttpConnection::Purpose::kFirstContact
                                                        : HttpConnection::Purpose::kRequests);
    }
    if (!connection) {
        return tl::unexpected(CredError::kOutOfMemory);
    }
    std::string body = options.upload ? "" : encodeForm(*fields);
    CredExpected<HttpAnswer> answer =
        options.upload ? connection->postFile(*url, *fields, *options.upload, options.deadline)
                       : connection->post(*url, body, options.deadline);
    OvraBase::wipe(body);
    for (auto &[name, value] : *fields) {
        OvraBase::wipe(value);
    }
    if (answer && options.reuse) {
        ConnectionPool::instance().keep(endpoint, trust, std::move(connection));
    }
    return std::move(answer).and_then(bodyOf);
}

CredExpected<WebReply> callPlain(const Endpoint &endpoint, const WireCall &call,
                                 const WebCallOptions &options) {
    return post(endpoint, call, options).and_then(readReply);
}

/// Over plain http the key itself must be the trusted one.
CredExpected<void> judgeSealKey(const Endpoint &endpoint, const PublicKey &key, bool firstContact) {
    const std::string fingerprint = fingerprintOf(key);
    TrustStore store;
    TrustVerdict verdict = store.lookup(endpoint.trustKey(), fingerprint);
    if (verdict == TrustVerdict::kUnknown &&
        (firstContact || isNamedByPeer(endpoint, fingerprint))) {
        verdict = store.pin(endpoint.trustKey(), fingerprint);
    }
    if (verdict == TrustVerdict::kTrusted) {
        return {};
    }
    logDistrust(endpoint, fingerprint, verdict);
    return tl::unexpected(errorOfTrust(verdict));
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

    CredExpected<WebReply> run() {
        for (;;) {
            if (const auto found = findKey(); !found) {
                return tl::unexpected(found.error());
            }
            WireCall outer;
            outer.api = call_.api;
            outer.version = call_.version;
            outer.method = call_.method;
            auto sealed = sealRequest(known_.key, call_, wallClock() + known_.clockOffset);
            if (!sealed) {
                return tl::unexpected(CredError::kSealFailed);
            }
            outer.sealed = std::move(sealed->envelope);
            const CredExpected<std::string> body = post(endpoint_, outer, options_);
            if (!body) {
                return tl::unexpected(body.error());
            }
            if (Ending ending = read(*body, sealed->replyKey)) {
                return std::move(*ending);
            }
        }
    }

private:
    /// The end of the call, or std::nullopt if it must be sent once more.
    using Ending = std::optional<CredExpected<WebReply>>;

    CredExpected<void> findKey() {
        const std::string key = endpoint_.key();
        if (const auto found = SealKeyCache::instance().find(key, TrustStore().stamp())) {
            known_ = *found;
            return {};
        }
        return fetchSealKey(endpoint_, options_)
            .and_then([this](const PublicKey &fetched) -> CredExpected<PublicKey> {
                const auto judged = endpoint_.isTls()
                                        ? CredExpected<void>()
                                        : judgeSealKey(endpoint_, fetched, options_.firstContact);
                return judged.map([&fetched] { return fetched; });
            })
            .map([&](const PublicKey &fetched) {
                known_ = {fetched, known_.clockOffset};
                SealKeyCache::instance().put(key, TrustStore().stamp(), known_);
            });
    }

    Ending read(const std::string &body, const ReplyKey &replyKey) {
        CredExpected<Json::Value> reply = parseReply(body);
        if (!reply) {
            return tl::unexpected(reply.error());
        }
        if (!reply->isObject()) {
            return tl::unexpected(CredError::kReplyBroken);
        }
        return reply->isMember("sealed_reply") ? readSealed(*reply, replyKey)
                                               : readPlain(*std::move(reply), body);
    }

    Ending readSealed(const Json::Value &reply, const ReplyKey &replyKey) {
        std::optional<std::string> text = openReply(replyKey, reply);
        if (!text) {
            return tl::unexpected(CredError::kReplyForged);
        }
        CredExpected<WebReply> opened = readReply(std::move(*text));
        // Only a time that came sealed is believed: a wrong one would let an attacker hold the
        // request back and deliver it later.
        if (!realigned_ && opened && sealRefusalReason(opened->response) == "stale" &&
            realign(opened->response)) {
            realigned_ = true;
            return std::nullopt;
        }
        return opened;
    }

    Ending readPlain(Json::Value &&document, const std::string &body) {
        OvraDRCore::Response response;
        response.setResp(std::move(document));
        if (!rekeyed_ && sealRefusalReason(response) == "key") {
            rekeyed_ = true;
            SealKeyCache::instance().drop(endpoint_.key());
            return std::nullopt;
        }
        if (!isPlainRefusal(response)) {
            return tl::unexpected(CredError::kReplyForged);
        }
        return WebReply{body, std::move(response)};
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

CredExpected<PublicKey> fetchSealKey(const Endpoint &endpoint, const WebCallOptions &options) {
    WireCall call;
    call.api = "OVRA.Core.Encryption";
    call.version = 1;
    call.method = "getinfo";
    WebCallOptions plain = options;
    plain.upload.reset();
    const CredExpected<WebReply> reply = callPlain(endpoint, call, plain);
    if (!reply) {
        // Of the request that it is for nothing has been sent.
        return tl::unexpected(withoutRequest(reply.error()));
    }
    const auto key = parsePublicKey(reply->response.getDataFieldtoStr("public_key"));
    if (!key) {
        OVRA_NOTICE("[%s] has no key to seal a request to", endpoint.key().c_str());
        return tl::unexpected(CredError::kSealFailed);
    }
    return *key;
}

CredExpected<WebReply> callWebAPI(const Endpoint &endpoint, const WireCall &call,
                                  const WebCallOptions &options) {
    if (!endpoint.isTls() && options.upload) {
        OVRA_ERR("A file cannot be sealed: use an https endpoint to send it");
        return tl::unexpected(CredError::kUploadUnreadable);
    }
    return endpoint.isTls() && !options.sealed ? callPlain(endpoint, call, options)
                                               : SealedCall(endpoint, call, options).run();
}

CredExpected<void> probe(const Endpoint &endpoint, const std::string &url, Deadline deadline) {
    const auto connection = HttpConnection::open(endpoint, HttpConnection::Purpose::kProbe);
    if (!connection) {
        return tl::unexpected(CredError::kOutOfMemory);
    }
    return connection->status(url, deadline).and_then([](long status) -> CredExpected<void> {
        if (status >= kHttpServerError || status == kHttpNotFound) {
            return tl::unexpected(CredError::kHttpStatus);
        }
        return {};
    });
}

} // namespace OvraPlatform
