// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovraplatform/appliance.h>
#include <ovraplatform/database.h>

#include <tl/expected.hpp>

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <ctime>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace Ovradrd {

/// Limits the guessing of passwords and one-time codes to 100 guesses an hour at one account, and
/// keeps nobody out who logged in before.
///
/// Each client has a budget of guesses at each account. Those that logged in to the account before,
/// known by their device token or, for 90 days, by their address, share one half of the account's
/// guesses, all others the other half: however many strangers guess, they leave the known ones
/// theirs. A stranger also has a budget for all accounts together. A log-in counts as a guess until
/// it turns out to be right.
///
/// The counts are in a SQLite file, so they hold across restarts and processes. A file that cannot
/// be used is logged; then guesses are counted in memory, and the file is tried again ten minutes
/// later. Neither the system clock nor changes of it matter while the process runs; at its start
/// counts that lie in the future mean that their budget is used up, and no more. Thread-safe.
class LoginThrottle {
public:
    struct Clock {
        std::function<std::chrono::milliseconds()> elapsed; ///< since any instant; is never set
        std::function<std::time_t()> system;                ///< seconds of the system clock
    };

    /// A log-in and where it comes from.
    struct Login {
        std::string account;
        std::string address; ///< numeric; "": through the relay, which hides it
        std::string device;  ///< the client's device token; "": none
    };

    /// An admitted log-in.
    class Attempt {
        friend class LoginThrottle;
        struct Charge {
            std::string key;
            std::int64_t cost; ///< milliseconds
        };
        std::vector<Charge> charges_;
    };

    /// How many budgets are kept; beyond that, those of which least is used are forgotten.
    static constexpr int kMaxBudgets = 16384;
    /// How many known clients are kept of one account, and of all; beyond that, the oldest are
    /// forgotten.
    static constexpr int kMaxKnown = 32;
    static constexpr int kMaxKnownOfAll = 65536;

    explicit LoginThrottle(std::string path = OvraPlatform::kLoginsFile,
                           Clock clock = systemClock());

    /// Reads which clients are known, for knows(); before the first log-in.
    void recall();
    /// Whether the client logged in to the account before, as far as memory goes: for whoever must
    /// not wait for the disk. admit() looks at the file.
    [[nodiscard]] bool knows(const Login &login) const;
    /// Asks for a log-in and counts it as a guess.
    /// \return how long to wait if there were too many guesses: nothing is counted, and the
    ///         password must not be checked.
    [[nodiscard]] tl::expected<Attempt, std::chrono::seconds> admit(const Login &login);
    /// It was no guess: it lacked the one-time code only, or could not be checked.
    void withdraw(const Attempt &attempt);
    /// It was right: it was no guess, and the client is known from now on.
    void recordSuccess(const Login &login, const Attempt &attempt);

private:
    using Database = OvraPlatform::Database;
    struct Budget;
    struct Use;

    static Clock systemClock();
    static std::string placeOf(const Login &login);
    static bool isKnown(Database &database, const std::string &account, const std::string &client,
                        std::int64_t since);
    static bool remember(Database &database, const std::string &account, const std::string &client,
                         std::int64_t now);
    static bool refund(Database &database, const Attempt &attempt);
    static bool bound(Database &database, std::int64_t now);
    static bool sweep(Database &database, std::int64_t now);

    bool change(const std::function<bool(Database &)> &work);
    bool admitIn(Database &database, const Login &login, Attempt &attempt,
                 std::chrono::milliseconds &wait) const;
    std::int64_t now() const;
    std::int64_t addressesSince() const;
    void giveFileUp();
    void learn(const std::string &account, const std::string &client, std::int64_t used);

    const std::string path_;
    const Clock clock_;
    const std::int64_t begin_; ///< of now(), at clock_.elapsed() == 0
    std::mutex mutex_;
    std::atomic<std::int64_t> fileFrom_ = 0; ///< from when on the file is tried again
    std::optional<Database> memory_;
    mutable std::mutex knownMutex_;
    std::unordered_map<std::string, std::int64_t> known_; ///< account and client -> last used
};

} // namespace Ovradrd
