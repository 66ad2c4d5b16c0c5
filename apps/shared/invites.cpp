// SPDX-License-Identifier: Apache-2.0
#include "shared/invites.h"

#include <ovrabase/encoding.h>

#include <sodium.h>

#include <algorithm>
#include <array>
#include <utility>

namespace OvraApps {

using OvraPlatform::Statement;
using OvraPlatform::Transaction;

namespace {

// "OvIv". `ended` is NULL while it is open, `node` unless it was taken up.
constexpr OvraPlatform::DatabaseLayout kLayout = {"store of invitations", 0x4F764976, 1, R"(
    CREATE TABLE invite (
        reference TEXT PRIMARY KEY,
        hash      BLOB NOT NULL,
        account   TEXT NOT NULL,
        created   INTEGER NOT NULL,
        expires   INTEGER NOT NULL,
        ended     INTEGER,
        node      TEXT,
        address   TEXT
    ) STRICT, WITHOUT ROWID;
)"};

#define OVRA_INVITE_COLUMNS "reference, account, created, expires, ended, node, address"

/// How far ahead a creation may lie before the clock must have been set back since.
constexpr std::int64_t kClockStep = 60;

std::string hashOf(std::string_view secret) {
    std::array<unsigned char, crypto_generichash_BYTES> hash{};
    crypto_generichash(hash.data(), hash.size(),
                       reinterpret_cast<const unsigned char *>(secret.data()), secret.size(),
                       nullptr, 0);
    return {hash.begin(), hash.end()};
}

std::string newReference() {
    std::array<unsigned char, Invites::kReferenceLength / 2> bytes{};
    randombytes_buf(bytes.data(), bytes.size());
    std::array<char, Invites::kReferenceLength + 1> text{};
    return sodium_bin2hex(text.data(), text.size(), bytes.data(), bytes.size());
}

InviteRefusal refusalFor(Invite::State state) {
    switch (state) {
    case Invite::State::kUsed:
        return InviteRefusal::kUsed;
    case Invite::State::kExpired:
        return InviteRefusal::kExpired;
    case Invite::State::kRevoked:
        return InviteRefusal::kRevoked;
    case Invite::State::kOpen:
        break;
    }
    return InviteRefusal::kNone;
}

} // namespace

const char *stateWord(Invite::State state) {
    switch (state) {
    case Invite::State::kUsed:
        return "used";
    case Invite::State::kExpired:
        return "expired";
    case Invite::State::kRevoked:
        return "revoked";
    case Invite::State::kOpen:
        break;
    }
    return "open";
}

Invites::Invites(const std::string &path, Clock clock)
    : database_(path, kLayout)
    , clock_(std::move(clock)) {}

std::int64_t Invites::now() const {
    return clock_ ? clock_() : std::time(nullptr);
}

bool Invites::isReference(std::string_view text) {
    return text.size() == kReferenceLength && std::all_of(text.begin(), text.end(), [](char c) {
               return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f');
           });
}

Invite Invites::read(const Statement &row) const {
    Invite invite;
    invite.reference = row.text(0);
    invite.account = row.text(1);
    invite.created = row.number(2);
    invite.expires = row.number(3);
    invite.ended = row.number(4);
    invite.node = row.text(5);
    invite.address = row.text(6);
    const bool past = invite.expires <= now() || invite.created > now() + kClockStep;
    if (!row.isNull(4)) {
        invite.state = row.isNull(5) ? Invite::State::kRevoked : Invite::State::kUsed;
    } else if (past) {
        invite.state = Invite::State::kExpired;
    }
    return invite;
}

std::optional<Invites::Made> Invites::make(const std::string &account, std::int64_t seconds) {
    if (!isOpen() || !OvraBase::sodiumReady()) {
        return std::nullopt;
    }
    database_.clearError();
    Made made;
    made.invite.reference = newReference();
    made.invite.account = account;
    made.invite.created = now();
    made.invite.expires = now() + seconds;
    OvraBase::SecretBytes<kSecretBytes> bytes;
    randombytes_buf(bytes.data(), bytes.size());
    std::string text = OvraBase::toBase64Url(bytes.data(), bytes.size());
    made.secret = OvraBase::Secret::take(text);

    Transaction transaction(database_);
    Statement sweep = database_.prepare("DELETE FROM invite WHERE coalesce(ended, expires) < ?1");
    if (!transaction.isOpen() || !sweep.bind(1, now() - kKept).run()) {
        return std::nullopt;
    }
    const bool done =
        database_
            .prepare("INSERT INTO invite (reference, hash, account, created, expires) "
                     "SELECT ?1, ?2, ?3, ?4, ?5 WHERE (SELECT count(*) FROM invite) < ?6")
            .bind(1, made.invite.reference)
            .bindBlob(2, hashOf(made.secret.get()))
            .bind(3, account)
            .bind(4, made.invite.created)
            .bind(5, made.invite.expires)
            .bind(6, kMaxInvites)
            .run();
    if (done && database_.changes() == 0) {
        database_.refuse("There are " + std::to_string(kMaxInvites) +
                         " invitations of the last days, as many as there may be. Wait a day.");
        return std::nullopt;
    }
    return done && transaction.commit() ? std::optional(std::move(made)) : std::nullopt;
}

InviteRefusal Invites::take(const std::string &reference, std::string_view secret,
                            const std::string &node, const std::string &address, Invite &invite) {
    if (!isOpen() || !OvraBase::sodiumReady()) {
        return InviteRefusal::kStoreFailed;
    }
    database_.clearError();
    Transaction transaction(database_);
    if (!transaction.isOpen()) {
        return InviteRefusal::kStoreFailed;
    }
    std::string hash(crypto_generichash_BYTES, '\0');
    Invite found;
    bool known = false;
    {
        Statement row = database_.prepare("SELECT " OVRA_INVITE_COLUMNS
                                          ", hash FROM invite WHERE reference = ?1");
        known = row.bind(1, reference).step();
        if (known) {
            found = read(row);
            hash = row.text(7);
        }
    }
    if (database_.failed()) {
        return InviteRefusal::kStoreFailed;
    }
    const std::string given = hashOf(secret);
    const bool right =
        hash.size() == given.size() && sodium_memcmp(hash.data(), given.data(), given.size()) == 0;
    if (!known || !right) {
        return InviteRefusal::kUnknown;
    }
    invite = found;
    if (invite.state != Invite::State::kOpen) {
        return refusalFor(invite.state);
    }
    const bool done = database_
                          .prepare("UPDATE invite SET ended = ?2, node = ?3, address = ?4 "
                                   "WHERE reference = ?1 AND ended IS NULL")
                          .bind(1, reference)
                          .bind(2, now())
                          .bind(3, node)
                          .bind(4, address)
                          .run();
    return done && database_.changes() == 1 && transaction.commit() ? InviteRefusal::kNone
                                                                    : InviteRefusal::kStoreFailed;
}

bool Invites::giveBack(const std::string &reference) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    return database_
        .prepare("UPDATE invite SET ended = NULL, node = NULL, address = NULL "
                 "WHERE reference = ?1 AND node IS NOT NULL")
        .bind(1, reference)
        .run();
}

bool Invites::revoke(const std::string &reference) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    const bool done =
        database_.prepare("UPDATE invite SET ended = ?2 WHERE reference = ?1 AND ended IS NULL")
            .bind(1, reference)
            .bind(2, now())
            .run();
    return done && database_.changes() == 1;
}

bool Invites::list(std::vector<Invite> &invites) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    Statement row =
        database_.prepare("SELECT " OVRA_INVITE_COLUMNS " FROM invite ORDER BY created, reference");
    while (row.step()) {
        invites.push_back(read(row));
    }
    return !database_.failed();
}

} // namespace OvraApps
