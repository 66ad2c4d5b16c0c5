// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/appliance.h"
#include "ovraplatform/database.h"
#include "ovraplatform/export.h"
#include "ovraplatform/role.h"

#include <cstdint>
#include <ctime>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace OvraPlatform {

/// An account of the appliance, as it may be shown.
struct Account {
    std::string name;
    Role role = Role::kUser;
    bool disabled = false;
    bool remoteLogin = true; ///< may log in over the network
    bool oneTimeCode = false;
    std::int64_t created = 0; ///< seconds of the system clock

    bool isAdministrator() const { return role == Role::kAdministrator; }
    /// Whether another node may be paired with it and act with its rights.
    bool mayPair() const { return role >= Role::kPairing && !disabled; }
};

/// The result of a log-in; the numbers are the log-in codes of the web API.
enum class LoginResult : int {
    kOk = 0,
    kStoreFailed = 100,  ///< unknown: AccountStore::error() says why
    kWrong = 400,        ///< no such account, or wrong password
    kDisabled = 401,     ///< the password is right, the account is disabled
    kNotPermitted = 402, ///< the password is right, the account may not log in over the network
    kCodeRequired = 403, ///< the password is right, the one-time code is missing
    kCodeWrong = 404,    ///< the password is right, the one-time code is not, or was used before
};

/// The appliance's accounts, in a SQLite file of mode 0600 that all processes share. Passwords are
/// kept as Argon2id hashes.
///
/// An object holds one connection: short-lived, for one thread, not kept across a fork. Operations
/// that return bool return false on failure, including for an unknown account; error() then gives
/// the reason, which never contains a secret.
class OVRAPLATFORM_EXPORT AccountStore {
public:
    static constexpr int kMaxAccounts = 4096;
    static constexpr std::size_t kMaxName = 64;
    static constexpr std::size_t kMinPassword = 8; ///< NIST SP 800-63B, 5.1.1.1
    static constexpr std::size_t kMaxPassword = 1024;

    using Clock = std::function<std::time_t()>;

    /// Opens the store; creates the file and its folder if missing.
    explicit AccountStore(const std::string &path = kAccountsFile, Clock clock = {});

    bool isOpen() const { return database_.isOpen(); }
    /// Why the last operation failed; "" if it succeeded.
    const std::string &error() const { return database_.error(); }

    /// 1 to 64 characters, ASCII letters, digits, ".", "_", "-" and "@"; the first is a letter, a
    /// digit or "_". Names are case-sensitive.
    static bool isName(std::string_view name);

    /// \param password  kMinPassword to kMaxPassword bytes of UTF-8, wiped by the caller
    [[nodiscard]] bool add(const std::string &name, std::string_view password, Role role);
    [[nodiscard]] bool setPassword(const std::string &name, std::string_view password);
    [[nodiscard]] bool setRole(const std::string &name, Role role);
    [[nodiscard]] bool setDisabled(const std::string &name, bool disabled);
    [[nodiscard]] bool setRemoteLogin(const std::string &name, bool permitted);
    /// From now on a log-in needs a code generated from `secret` (base32, see totp.h).
    [[nodiscard]] bool setTotp(const std::string &name, const std::string &secret);
    [[nodiscard]] bool clearTotp(const std::string &name);
    [[nodiscard]] bool remove(const std::string &name);

    bool exists(const std::string &name) { return find(name).has_value(); }
    [[nodiscard]] std::optional<Account> find(const std::string &name);
    /// All accounts, sorted by name.
    [[nodiscard]] bool list(std::vector<Account> &accounts);

    /// Checks a log-in over the network. An unknown account takes as long as a wrong password, and
    /// nothing about an account is revealed before the password is right. A code is accepted only
    /// once, even if several processes check it at the same moment. No lock is held while the
    /// password is hashed, which takes about a tenth of a second and 64 MiB: the caller limits how
    /// many run at once.
    LoginResult verify(const std::string &name, std::string_view password,
                       std::string_view oneTimeCode);

private:
    [[nodiscard]] bool checkPassword(std::string_view password);
    [[nodiscard]] bool setColumn(const char *sql, const std::string &name, std::int64_t value);
    [[nodiscard]] bool changedOne(const std::string &name);
    LoginResult checkAccount(const std::string &name, const std::string &hash,
                             std::string_view oneTimeCode);
    LoginResult spendCode(const std::string &name, const std::string &secret, std::int64_t lastStep,
                          std::string_view oneTimeCode);
    void renewHash(const std::string &name, const std::string &hash, std::string_view password);
    std::int64_t now() const;

    Database database_;
    Clock clock_;
};

} // namespace OvraPlatform
