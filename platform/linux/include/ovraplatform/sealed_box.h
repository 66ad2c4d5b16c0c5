// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"
#include "ovraplatform/wire_form.h"

#include <ovrabase/secret.h>

#include <sodium.h>
#include <tl/expected.hpp>

#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <utility>

// The sealed envelope: a request that only the receiving appliance can read, and a reply that only
// the sender of that request can read. Both sides use this; docs/wire.md describes the bytes.
namespace OvraPlatform {

using PublicKey = std::array<unsigned char, crypto_box_PUBLICKEYBYTES>;
/// The key that seals the reply to one request.
struct ReplyKey : OvraBase::SecretBytes<crypto_secretbox_KEYBYTES> {};

/// The text form of a public key on the wire.
OVRAPLATFORM_EXPORT std::string publicKeyText(const PublicKey &key);
/// "SHA256:..." of the key.
OVRAPLATFORM_EXPORT std::string fingerprintOf(const PublicKey &key);

/// The key pair of an appliance.
class OVRAPLATFORM_EXPORT SealKeyPair {
public:
    /// Reads a key file. \return why it failed: missing, damaged, or readable by others
    [[nodiscard]] static tl::expected<SealKeyPair, std::string> load(const std::string &path);
    /// Creates a key pair and its file, mode 0600. An existing file is never replaced but loaded,
    /// even if another process created it at the same time.
    [[nodiscard]] static tl::expected<SealKeyPair, std::string>
    loadOrCreate(const std::string &path);

    const PublicKey &publicKey() const { return public_; }
    /// The JSON object inside an envelope; std::nullopt if it was not sealed to these keys.
    [[nodiscard]] std::optional<Json::Value> unseal(const std::string &envelope) const;

private:
    SealKeyPair() = default;

    PublicKey public_{};
    OvraBase::SecretBytes<crypto_box_SECRETKEYBYTES> secret_;
};

/// Milliseconds since 1970.
using UnixMillis = std::int64_t;

using SealNonce = std::array<unsigned char, 16>;

/// Refuses sealed requests that are old or were seen before. Thread-safe.
///
/// Its clock follows the system's forwards but never runs back, so that setting the clock back does
/// not make old requests fresh again. After a restart nothing older than the start is accepted.
class OVRAPLATFORM_EXPORT ReplayGuard {
public:
    /// How far behind this clock a request's stamp may be: it is stamped before connecting.
    static constexpr UnixMillis kMaxPast = 60'000;
    /// How far ahead of it: the drift of a clock that was just aligned.
    static constexpr UnixMillis kMaxFuture = 10'000;
    static constexpr std::size_t kMaxSeen = 65'536;

    /// Where the time comes from: milliseconds of the system clock and of a steady one.
    struct Clocks {
        std::function<UnixMillis()> wall;
        std::function<UnixMillis()> steady;
    };
    enum class Verdict { kFresh, kStale, kSeen };

    ReplayGuard();
    /// \param capacity  how many requests are remembered; if more come within the window, the
    ///                  oldest are forgotten and anything that old is stale
    explicit ReplayGuard(Clocks clocks, std::size_t capacity = kMaxSeen);

    /// Checks a request and remembers a fresh one.
    Verdict admit(UnixMillis time, const SealNonce &nonce);
    /// The time to stamp a request with.
    UnixMillis now();

private:
    UnixMillis nowLocked();

    Clocks clocks_;
    std::size_t capacity_;
    std::mutex mutex_;
    UnixMillis offset_;
    UnixMillis floor_; ///< stamps up to here are stale
    std::set<std::pair<UnixMillis, SealNonce>> seen_;
};

enum class SealVerdict {
    kOpened,
    kUnreadable, ///< not sealed to this key; there is no reply key either
    kOtherCall,  ///< sealed for another API, method or version
    kStale,
    kReplayed,
};

struct OpenedRequest {
    WireCall call;
    ReplyKey replyKey;
};

/// Opens the envelope `visible.sealed`.
/// \param opened  receives the whole call if it was opened, and the reply key unless it was
/// unreadable
OVRAPLATFORM_EXPORT SealVerdict openRequest(const SealKeyPair &keys, const WireCall &visible,
                                            ReplayGuard &guard, OpenedRequest &opened);

/// The error reply (code 109) for a verdict other than kOpened.
OVRAPLATFORM_EXPORT Json::Value sealRefusal(SealVerdict verdict, UnixMillis now);

/// The sealed form of a reply document: a JSON text.
OVRAPLATFORM_EXPORT std::string sealReply(const ReplyKey &key, const std::string &document);

} // namespace OvraPlatform
