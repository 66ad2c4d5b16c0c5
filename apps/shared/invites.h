// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/secret.h>
#include <ovraplatform/database.h>

#include <cstdint>
#include <ctime>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace OvraApps {

/// Mode 0600. docs/files.md describes it.
inline constexpr char kInvitesFile[] = "/usr/ovra/var/ovradr/invites.db";

/// The API with which an invitation is taken up: docs/wire.md.
inline constexpr char kInviteApi[] = "OVRA.DR.Invite";
inline constexpr int kInviteVersion = 1;
inline constexpr char kRedeem[] = "redeem";

/// Why an invitation is not taken up; the numbers are the error codes of kInviteApi.
enum class InviteRefusal : int {
    kNone = 0,
    kStoreFailed = 100, ///< unknown: Invites::error() says why
    kUnknown = 410,     ///< no such invitation, or the wrong secret
    kUsed = 411,
    kExpired = 412,
    kRevoked = 413,
    kAccount = 414, ///< its account is gone, disabled or may not pair any more
};

/// A grant of one session of an account to whoever knows its secret, once and for a short time.
struct Invite {
    enum class State { kOpen, kUsed, kExpired, kRevoked };

    std::string reference; ///< names it to people; opens nothing
    std::string account;
    std::int64_t created = 0; ///< seconds of the system clock, as all times here
    std::int64_t expires = 0;
    State state = State::kOpen;
    std::int64_t ended = 0; ///< when it was used or revoked
    std::string node;       ///< with kUsed: the id of the node that took it up, as that says
    std::string address;    ///< with kUsed: from where
};

/// "open", "used", "expired" or "revoked".
const char *stateWord(Invite::State state);

/// The invitations of this appliance, in a SQLite file that all processes share. Their secrets are
/// kept as BLAKE2b hashes: 96 random bits need no slow one. Those that have ended are kept for
/// kKept seconds, to say why they open nothing any more.
///
/// An object holds one connection: short-lived, for one thread. Every change is one transaction.
class Invites {
public:
    static constexpr std::size_t kReferenceLength = 8; ///< lower-case hexadecimal digits
    static constexpr std::size_t kSecretBytes = 12;
    static constexpr std::size_t kSecretLength = 16; ///< in base64url
    static constexpr int kMaxInvites = 1024;
    static constexpr std::int64_t kKept = std::int64_t{7} * 24 * 3600;

    using Clock = std::function<std::time_t()>;

    struct Made {
        Invite invite;
        OvraBase::Secret secret; ///< kSecretLength characters of base64url; nobody keeps it
    };

    /// Opens the store; creates the file and its folder if missing.
    explicit Invites(const std::string &path = kInvitesFile, Clock clock = {});

    bool isOpen() const { return database_.isOpen(); }
    /// Why the last operation failed; "" if it succeeded.
    const std::string &error() const { return database_.error(); }

    static bool isReference(std::string_view text);

    /// \param seconds  how long it is good for
    [[nodiscard]] std::optional<Made> make(const std::string &account, std::int64_t seconds);
    /// Takes an invitation up: of any number of callers with the right secret one gets kNone. The
    /// time taken reveals nothing about the secret, and nothing about the invitation is told to who
    /// does not know it.
    /// \param node, address  who takes it up, to be shown
    /// \param invite         filled unless the secret is wrong
    InviteRefusal take(const std::string &reference, std::string_view secret,
                       const std::string &node, const std::string &address, Invite &invite);
    /// It was taken, but nothing could be granted: it is open again. \return false on failure.
    [[nodiscard]] bool giveBack(const std::string &reference);
    /// \return false on failure, and if it is not open.
    [[nodiscard]] bool revoke(const std::string &reference);
    /// All, oldest first. \return false on failure.
    [[nodiscard]] bool list(std::vector<Invite> &invites);

private:
    std::int64_t now() const;
    Invite read(const OvraPlatform::Statement &row) const;

    OvraPlatform::Database database_;
    Clock clock_;
};

} // namespace OvraApps
