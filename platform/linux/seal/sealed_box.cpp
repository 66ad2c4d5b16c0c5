// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/sealed_box.h"

#include "ovraplatform/api_errors.h"
#include "seal/sealing.h"

#include <ovrabase/encoding.h>
#include <ovradrcore/json.h>

#include <algorithm>
#include <chrono>
#include <vector>

namespace OvraPlatform {

namespace {

/// Plain text is filled up with blanks to a multiple of this, so that the length of a password does
/// not show in the length of the envelope.
constexpr std::size_t kPadding = 256;

const unsigned char *bytesOf(const std::string &text) {
    return reinterpret_cast<const unsigned char *>(text.data());
}

unsigned char *bytesOf(std::string &text) {
    return reinterpret_cast<unsigned char *>(text.data());
}

UnixMillis steadyClock() {
    using namespace std::chrono;
    return duration_cast<milliseconds>(steady_clock::now().time_since_epoch()).count();
}

/// The member as bytes of exactly the size of `target`.
template <typename Bytes>
bool takeBytes(const Json::Value &object, const char *member, Bytes &target) {
    const auto bytes = OvraBase::fromBase64Url(OvraDRCore::memberString(object, member));
    if (!bytes || bytes->size() != target.size()) {
        return false;
    }
    std::copy(bytes->begin(), bytes->end(), target.begin());
    return true;
}

ReplayGuard::Clocks systemClocks() {
    return {wallClock, steadyClock};
}

} // namespace

UnixMillis wallClock() {
    using namespace std::chrono;
    return duration_cast<milliseconds>(system_clock::now().time_since_epoch()).count();
}

std::string publicKeyText(const PublicKey &key) {
    return OvraBase::toBase64Url(key.data(), key.size());
}

std::optional<PublicKey> parsePublicKey(const std::string &text) {
    const auto bytes = OvraBase::fromBase64Url(text);
    PublicKey key{};
    if (!bytes || bytes->size() != key.size()) {
        return std::nullopt;
    }
    std::copy(bytes->begin(), bytes->end(), key.begin());
    return key;
}

std::string fingerprintOf(const PublicKey &key) {
    return OvraBase::fingerprintOf(key.data(), key.size());
}

std::optional<Json::Value> SealKeyPair::unseal(const std::string &envelope) const {
    const auto sealed = OvraBase::fromBase64Url(envelope);
    if (!sealed || sealed->size() < crypto_box_SEALBYTES) {
        return std::nullopt;
    }
    std::string text(sealed->size() - crypto_box_SEALBYTES, '\0');
    const OvraBase::WipeAtEnd wipe(text);
    Json::Value plain;
    if (crypto_box_seal_open(bytesOf(text), sealed->data(), sealed->size(), public_.data(),
                             secret_.data()) != 0 ||
        OvraDRCore::parseJson(plain, text, OvraDRCore::kRequestLimits) !=
            OvraDRCore::JsonFault::kNone ||
        !plain.isObject()) {
        return std::nullopt;
    }
    return plain;
}

ReplayGuard::ReplayGuard()
    : ReplayGuard(systemClocks()) {}

ReplayGuard::ReplayGuard(Clocks clocks, std::size_t capacity)
    : clocks_(std::move(clocks))
    , capacity_(capacity)
    , offset_(clocks_.wall() - clocks_.steady())
    , floor_(clocks_.wall() - 1) {}

UnixMillis ReplayGuard::nowLocked() {
    const UnixMillis steady = clocks_.steady();
    offset_ = std::max(offset_, clocks_.wall() - steady);
    return steady + offset_;
}

UnixMillis ReplayGuard::now() {
    const std::lock_guard<std::mutex> lock(mutex_);
    return nowLocked();
}

ReplayGuard::Verdict ReplayGuard::admit(UnixMillis time, const SealNonce &nonce) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const UnixMillis now = nowLocked();
    floor_ = std::max(floor_, now - kMaxPast);
    seen_.erase(seen_.begin(), std::find_if(seen_.begin(), seen_.end(), [this](const auto &entry) {
                    return entry.first > floor_;
                }));
    if (time <= floor_ || time > now + kMaxFuture) {
        return Verdict::kStale;
    }
    if (!seen_.emplace(time, nonce).second) {
        return Verdict::kSeen;
    }
    if (seen_.size() > capacity_) {
        floor_ = std::max(floor_, seen_.begin()->first);
        seen_.erase(seen_.begin());
    }
    return Verdict::kFresh;
}

std::optional<SealedRequest> sealRequest(const PublicKey &receiver, const WireCall &call,
                                         UnixMillis time) {
    if (!OvraBase::sodiumReady()) {
        return std::nullopt;
    }
    SealedRequest request;
    SealNonce nonce{};
    randombytes_buf(nonce.data(), nonce.size());
    randombytes_buf(request.replyKey.data(), request.replyKey.size());

    Json::Value plain(Json::objectValue);
    plain["api"] = call.api;
    plain["version"] = call.version;
    plain["method"] = call.method;
    plain["time"] = Json::Int64{time};
    plain["nonce"] = OvraBase::toBase64Url(nonce.data(), nonce.size());
    plain["params"] = call.params;
    plain["sid"] = call.sid;
    plain["reply_key"] = OvraBase::toBase64Url(request.replyKey.data(), request.replyKey.size());
    std::string text = OvraDRCore::toString(plain);
    const OvraBase::WipeAtEnd wipe(text);
    text.append((kPadding - text.size() % kPadding) % kPadding, ' ');

    std::vector<unsigned char> sealed(text.size() + crypto_box_SEALBYTES);
    if (crypto_box_seal(sealed.data(), bytesOf(text), text.size(), receiver.data()) != 0) {
        return std::nullopt;
    }
    request.envelope = OvraBase::toBase64Url(sealed.data(), sealed.size());
    return request;
}

SealVerdict openRequest(const SealKeyPair &keys, const WireCall &visible, ReplayGuard &guard,
                        OpenedRequest &opened) {
    const std::optional<Json::Value> envelope = keys.unseal(visible.sealed);
    if (!envelope) {
        return SealVerdict::kUnreadable;
    }
    const Json::Value &plain = *envelope;
    const Json::Value &params = plain["params"];
    SealNonce nonce{};
    if (!takeBytes(plain, "reply_key", opened.replyKey) || !takeBytes(plain, "nonce", nonce) ||
        !plain["time"].isInt64() || !plain["version"].isInt() ||
        !(params.isNull() || params.isObject())) {
        return SealVerdict::kUnreadable;
    }
    opened.call.api = OvraDRCore::memberString(plain, "api");
    opened.call.method = OvraDRCore::memberString(plain, "method");
    opened.call.version = plain["version"].asInt();
    opened.call.sid = OvraDRCore::memberString(plain, "sid");
    opened.call.params = params;
    if (opened.call.api != visible.api || opened.call.method != visible.method ||
        opened.call.version != visible.version) {
        return SealVerdict::kOtherCall;
    }
    switch (guard.admit(plain["time"].asInt64(), nonce)) {
    case ReplayGuard::Verdict::kFresh:
        return SealVerdict::kOpened;
    case ReplayGuard::Verdict::kStale:
        return SealVerdict::kStale;
    case ReplayGuard::Verdict::kSeen:
        break;
    }
    return SealVerdict::kReplayed;
}

Json::Value sealRefusal(SealVerdict verdict, UnixMillis now) {
    Json::Value message(Json::objectValue);
    message["time"] = Json::Int64{now};
    switch (verdict) {
    case SealVerdict::kStale:
        message["reason"] = "stale";
        message["text"] = "the request is too old or too new: stamp it with this time";
        break;
    case SealVerdict::kReplayed:
        message["reason"] = "replayed";
        message["text"] = "the same request was seen before: seal it anew";
        break;
    case SealVerdict::kOtherCall:
        message["reason"] = "call";
        message["text"] = "the request was sealed for another call";
        break;
    default:
        message["reason"] = "key";
        message["text"] = "the request was not sealed to this appliance's key: ask for the key";
        break;
    }
    return apiError(APIError::kSealRefused, message);
}

std::string sealReply(const ReplyKey &key, const std::string &document) {
    std::vector<unsigned char> sealed(crypto_secretbox_NONCEBYTES + crypto_secretbox_MACBYTES +
                                      document.size());
    randombytes_buf(sealed.data(), crypto_secretbox_NONCEBYTES);
    crypto_secretbox_easy(sealed.data() + crypto_secretbox_NONCEBYTES, bytesOf(document),
                          document.size(), sealed.data(), key.data());
    Json::Value reply(Json::objectValue);
    reply["sealed_reply"] = OvraBase::toBase64Url(sealed.data(), sealed.size());
    return OvraDRCore::toString(reply);
}

std::optional<std::string> openReply(const ReplyKey &key, const Json::Value &reply) {
    constexpr std::size_t kOverhead = crypto_secretbox_NONCEBYTES + crypto_secretbox_MACBYTES;
    const auto sealed = OvraBase::fromBase64Url(OvraDRCore::memberString(reply, "sealed_reply"));
    if (!sealed || sealed->size() < kOverhead) {
        return std::nullopt;
    }
    std::string document(sealed->size() - kOverhead, '\0');
    if (crypto_secretbox_open_easy(bytesOf(document), sealed->data() + crypto_secretbox_NONCEBYTES,
                                   sealed->size() - crypto_secretbox_NONCEBYTES, sealed->data(),
                                   key.data()) != 0) {
        return std::nullopt;
    }
    return document;
}

} // namespace OvraPlatform
