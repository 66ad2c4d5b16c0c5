// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/account_store.h"

#include "ovraplatform/totp.h"

#include <ovrabase/encoding.h>
#include <ovrabase/secret.h>
#include <ovrabase/utf8.h>
#include <ovradrcore/log.h>
#include <ovradrcore/no_fork.h>

#include <sodium.h>

#include <algorithm>
#include <array>
#include <utility>

namespace OvraPlatform {

namespace {

// "OvAc". last_step is the TOTP step whose code was accepted last; role is a number of Role, and
// before layout 2 was whether the account is an administrator.
constexpr DatabaseLayout kLayout = {"account store", 0x4F764163, 2, R"(
    CREATE TABLE account (
        name      TEXT PRIMARY KEY,
        hash      TEXT NOT NULL,
        admin     INTEGER NOT NULL DEFAULT 0,
        disabled  INTEGER NOT NULL DEFAULT 0,
        remote    INTEGER NOT NULL DEFAULT 1,
        totp      TEXT,
        last_step INTEGER NOT NULL DEFAULT -1,
        created   INTEGER NOT NULL
    ) STRICT, WITHOUT ROWID;
)",
                                    R"(
    ALTER TABLE account RENAME COLUMN admin TO role;
    UPDATE account SET role = 2 WHERE role != 0;
)"};

constexpr unsigned long long kOpsLimit = crypto_pwhash_OPSLIMIT_INTERACTIVE;
constexpr std::size_t kMemLimit = crypto_pwhash_MEMLIMIT_INTERACTIVE;

/// The Argon2id hash of a password; "" if there is no memory for it.
std::string hashPassword(std::string_view password) {
    std::array<char, crypto_pwhash_STRBYTES> hash{};
    if (!OvraBase::sodiumReady() || crypto_pwhash_str(hash.data(), password.data(), password.size(),
                                                      kOpsLimit, kMemLimit) != 0) {
        return {};
    }
    return hash.data();
}

/// What the password of an account that does not exist is checked against: the hash of a password
/// that nobody knows.
const std::string &dummyHash() {
    const OvraDRCore::NoFork whole; // a child would wait for ever for the end of its making
    static const std::string hash = [] {
        std::array<char, 32> password{};
        randombytes_buf(password.data(), password.size());
        return hashPassword({password.data(), password.size()});
    }();
    return hash;
}

bool isPassword(const std::string &hash, std::string_view password) {
    return crypto_pwhash_str_verify(hash.c_str(), password.data(), password.size()) == 0;
}

bool isNameCharacter(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_';
}

/// A number that this version does not know grants nothing.
Role roleOf(std::int64_t number) {
    switch (number) {
    case static_cast<int>(Role::kAdministrator):
        return Role::kAdministrator;
    case static_cast<int>(Role::kPairing):
        return Role::kPairing;
    default:
        return Role::kUser;
    }
}

Account readAccount(const Statement &row) {
    Account account;
    account.name = row.text(0);
    account.role = roleOf(row.number(1));
    account.disabled = row.number(2) != 0;
    account.remoteLogin = row.number(3) != 0;
    account.oneTimeCode = row.number(4) != 0;
    account.created = row.number(5);
    return account;
}

} // namespace

AccountStore::AccountStore(const std::string &path, Clock clock)
    : database_(path, kLayout)
    , clock_(std::move(clock)) {}

std::int64_t AccountStore::now() const {
    return clock_ ? clock_() : std::time(nullptr);
}

bool AccountStore::isName(std::string_view name) {
    return !name.empty() && name.size() <= kMaxName && isNameCharacter(name.front()) &&
           std::all_of(name.begin(), name.end(), [](char c) {
               return isNameCharacter(c) || c == '.' || c == '-' || c == '@';
           });
}

bool AccountStore::checkPassword(std::string_view password) {
    if (password.size() < kMinPassword || password.size() > kMaxPassword) {
        return database_.refuse("A password has " + std::to_string(kMinPassword) + " to " +
                                std::to_string(kMaxPassword) + " bytes. Choose another one.");
    }
    // No other appliance could log in with it: a request carries text.
    return (OvraBase::isUtf8(password) && password.find('\0') == std::string_view::npos) ||
           database_.refuse(
               "A password is text in UTF-8. Set the terminal or the file to UTF-8, or "
               "choose another one.");
}

bool AccountStore::changedOne(const std::string &name) {
    return database_.changes() == 1 || database_.refuse("There is no account [" + name + "].");
}

bool AccountStore::add(const std::string &name, std::string_view password, Role role) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    if (!isName(name)) {
        return database_.refuse("[" + name + "] is not an account name. Use 1 to " +
                                std::to_string(kMaxName) +
                                " letters, digits, \".\", \"_\", \"-\" or \"@\", the first one a "
                                "letter, a digit or \"_\".");
    }
    if (!checkPassword(password)) {
        return false;
    }
    const std::string hash = hashPassword(password);
    if (hash.empty()) {
        return database_.fail("There is no memory to hash a password. Free 64 MiB and try again.");
    }
    const bool done =
        database_
            .prepare("INSERT INTO account (name, hash, role, created) SELECT ?1, ?2, ?3, ?4 "
                     "WHERE (SELECT count(*) FROM account) < ?5 ON CONFLICT DO NOTHING")
            .bind(1, name)
            .bind(2, hash)
            .bind(3, static_cast<int>(role))
            .bind(4, now())
            .bind(5, kMaxAccounts)
            .run();
    if (!done || database_.changes() == 1) {
        return done;
    }
    return database_.refuse(exists(name) ? "There is an account [" + name + "] already."
                                         : "There are " + std::to_string(kMaxAccounts) +
                                               " accounts, as many as there may be.");
}

bool AccountStore::setPassword(const std::string &name, std::string_view password) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    if (!checkPassword(password)) {
        return false;
    }
    const std::string hash = hashPassword(password);
    if (hash.empty()) {
        return database_.fail("There is no memory to hash a password. Free 64 MiB and try again.");
    }
    return database_.prepare("UPDATE account SET hash = ?2 WHERE name = ?1")
               .bind(1, name)
               .bind(2, hash)
               .run() &&
           changedOne(name);
}

bool AccountStore::setColumn(const char *sql, const std::string &name, std::int64_t value) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    return database_.prepare(sql).bind(1, name).bind(2, value).run() && changedOne(name);
}

bool AccountStore::setRole(const std::string &name, Role role) {
    return setColumn("UPDATE account SET role = ?2 WHERE name = ?1", name, static_cast<int>(role));
}

bool AccountStore::setDisabled(const std::string &name, bool disabled) {
    return setColumn("UPDATE account SET disabled = ?2 WHERE name = ?1", name, disabled ? 1 : 0);
}

bool AccountStore::setRemoteLogin(const std::string &name, bool permitted) {
    return setColumn("UPDATE account SET remote = ?2 WHERE name = ?1", name, permitted ? 1 : 0);
}

bool AccountStore::setTotp(const std::string &name, const std::string &secret) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    const std::string normal = normalizeTotpSecret(secret);
    if (normal.empty()) {
        return database_.refuse("That is not the secret of an authenticator. It is base32 text of "
                                "128 to 512 bits.");
    }
    return database_.prepare("UPDATE account SET totp = ?2, last_step = -1 WHERE name = ?1")
               .bind(1, name)
               .bind(2, normal)
               .run() &&
           changedOne(name);
}

bool AccountStore::clearTotp(const std::string &name) {
    return setColumn("UPDATE account SET totp = NULL, last_step = ?2 WHERE name = ?1", name, -1);
}

bool AccountStore::remove(const std::string &name) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    return database_.prepare("DELETE FROM account WHERE name = ?1").bind(1, name).run() &&
           changedOne(name);
}

std::optional<Account> AccountStore::find(const std::string &name) {
    if (!isOpen()) {
        return std::nullopt;
    }
    database_.clearError();
    Statement row = database_.prepare("SELECT name, role, disabled, remote, totp IS NOT NULL, "
                                      "created FROM account WHERE name = ?1");
    row.bind(1, name);
    return row.step() ? std::optional(readAccount(row)) : std::nullopt;
}

bool AccountStore::list(std::vector<Account> &accounts) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    Statement row = database_.prepare("SELECT name, role, disabled, remote, totp IS NOT NULL, "
                                      "created FROM account ORDER BY name");
    while (row.step()) {
        accounts.push_back(readAccount(row));
    }
    return !database_.failed();
}

LoginResult AccountStore::verify(const std::string &name, std::string_view password,
                                 std::string_view oneTimeCode) {
    if (!isOpen()) {
        return LoginResult::kStoreFailed;
    }
    database_.clearError();
    const std::string &dummy = dummyHash();
    std::string hash;
    {
        Statement row = database_.prepare("SELECT hash FROM account WHERE name = ?1");
        row.bind(1, name);
        if (row.step()) {
            hash = row.text(0);
        }
    }
    if (database_.failed()) {
        return LoginResult::kStoreFailed;
    }
    const bool right = isPassword(hash.empty() ? dummy : hash, password.substr(0, kMaxPassword));
    if (hash.empty() || !right || password.size() > kMaxPassword) {
        return LoginResult::kWrong;
    }
    const LoginResult result = checkAccount(name, hash, oneTimeCode);
    if (result == LoginResult::kOk) {
        renewHash(name, hash, password);
    }
    return result;
}

/// Everything after the password, for the account as it is now: it may have changed while the
/// password was hashed, so `hash` must still match.
LoginResult AccountStore::checkAccount(const std::string &name, const std::string &hash,
                                       std::string_view oneTimeCode) {
    std::string secret;
    std::int64_t lastStep = -1;
    {
        Statement row = database_.prepare("SELECT disabled, remote, totp, last_step FROM account "
                                          "WHERE name = ?1 AND hash = ?2");
        row.bind(1, name).bind(2, hash);
        if (!row.step()) {
            return database_.failed() ? LoginResult::kStoreFailed : LoginResult::kWrong;
        }
        if (row.number(0) != 0) {
            return LoginResult::kDisabled;
        }
        if (row.number(1) == 0) {
            return LoginResult::kNotPermitted;
        }
        if (row.isNull(2)) {
            return LoginResult::kOk;
        }
        secret = row.text(2);
        lastStep = row.number(3);
    }
    const LoginResult result = oneTimeCode.empty() ? LoginResult::kCodeRequired
                                                   : spendCode(name, secret, lastStep, oneTimeCode);
    OvraBase::wipe(secret);
    return result;
}

/// Two processes may have found the same code right: the one whose update changes the row wins.
LoginResult AccountStore::spendCode(const std::string &name, const std::string &secret,
                                    std::int64_t lastStep, std::string_view oneTimeCode) {
    const std::optional<std::int64_t> step =
        matchTotp(secret, oneTimeCode, static_cast<std::time_t>(now()), lastStep);
    if (!step) {
        return LoginResult::kCodeWrong;
    }
    const bool done = database_
                          .prepare("UPDATE account SET last_step = ?3 "
                                   "WHERE name = ?1 AND totp = ?2 AND last_step < ?3")
                          .bind(1, name)
                          .bind(2, secret)
                          .bind(3, *step)
                          .run();
    if (!done) {
        return LoginResult::kStoreFailed;
    }
    return database_.changes() == 1 ? LoginResult::kOk : LoginResult::kCodeWrong;
}

void AccountStore::renewHash(const std::string &name, const std::string &hash,
                             std::string_view password) {
    if (crypto_pwhash_str_needs_rehash(hash.c_str(), kOpsLimit, kMemLimit) == 0) {
        return;
    }
    const std::string renewed = hashPassword(password);
    if (!renewed.empty() && database_
                                .prepare("UPDATE account SET hash = ?3 WHERE name = ?1 AND "
                                         "hash = ?2")
                                .bind(1, name)
                                .bind(2, hash)
                                .bind(3, renewed)
                                .run()) {
        OVRA_INFO("The password of account [%s] is kept with the present cost of hashing.",
                  name.c_str());
    }
}

} // namespace OvraPlatform
