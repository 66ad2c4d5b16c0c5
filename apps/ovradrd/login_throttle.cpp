// SPDX-License-Identifier: Apache-2.0
#include "login_throttle.h"

#include <ovrabase/address.h>
#include <ovradrcore/log.h>

#include <sodium.h>

#include <algorithm>
#include <array>
#include <initializer_list>
#include <utility>

namespace Ovradrd {

namespace {

using OvraPlatform::Statement;
using std::chrono::milliseconds;

// "OvLo". Keys are hashes: people type passwords where an account belongs.
constexpr OvraPlatform::DatabaseLayout kLayout = {"memory of log-ins", 0x4F764C6F, 1, R"(
    CREATE TABLE budget (
        key  BLOB PRIMARY KEY,
        free INTEGER NOT NULL
    ) STRICT, WITHOUT ROWID;
    CREATE INDEX budget_free ON budget (free);
    CREATE TABLE known (
        account BLOB NOT NULL,
        client  BLOB NOT NULL,
        used    INTEGER NOT NULL,
        PRIMARY KEY (account, client)
    ) STRICT, WITHOUT ROWID;
)"};

constexpr std::int64_t kMinute = 60'000;
/// Seconds; then it may be another customer's.
constexpr std::int64_t kAddressKnownFor = std::int64_t{90} * 24 * 3600;
constexpr milliseconds kFilePause{10 * kMinute};
constexpr std::size_t kKeyBytes = 16;

std::string keyOf(std::initializer_list<std::string_view> parts) {
    crypto_generichash_state state;
    crypto_generichash_init(&state, nullptr, 0, kKeyBytes);
    for (const std::string_view part : parts) {
        const std::uint64_t size = part.size();
        crypto_generichash_update(&state, reinterpret_cast<const unsigned char *>(&size),
                                  sizeof size);
        crypto_generichash_update(&state, reinterpret_cast<const unsigned char *>(part.data()),
                                  part.size());
    }
    std::array<unsigned char, kKeyBytes> key{};
    crypto_generichash_final(&state, key.data(), key.size());
    return {key.begin(), key.end()};
}

} // namespace

/// So many guesses at once, and one more whenever the interval has passed: never more than
/// burst + T/interval in any time T. One number says how much of it is used, the time at which it
/// is free again (the generic cell rate algorithm, ITU-T I.371).
struct LoginThrottle::Budget {
    std::int64_t burst;
    std::int64_t interval; ///< milliseconds

    std::int64_t most() const { return burst * interval; }
};

namespace {

// In an hour 20 + 30 guesses of known clients and as many of all others: 100 at one account.
constexpr std::int64_t kPoolBurst = 20;
constexpr std::int64_t kPoolInterval = 2 * kMinute;
// One client leaves others something, of the burst and from then on.
constexpr std::int64_t kClientBurst = 10;
constexpr std::int64_t kClientInterval = 3 * kMinute;
// A stranger, at all accounts.
constexpr std::int64_t kStrangerBurst = 30;
constexpr std::int64_t kStrangerInterval = kMinute;

} // namespace

/// A budget that an admitted log-in uses.
struct LoginThrottle::Use {
    std::string key;
    Budget budget;
};

LoginThrottle::Clock LoginThrottle::systemClock() {
    return {[] {
                return std::chrono::duration_cast<milliseconds>(
                    std::chrono::steady_clock::now().time_since_epoch());
            },
            [] { return std::time(nullptr); }};
}

LoginThrottle::LoginThrottle(std::string path, Clock clock)
    : path_(std::move(path))
    , clock_(std::move(clock))
    , begin_(std::int64_t{clock_.system()} * 1000 - clock_.elapsed().count()) {}

std::int64_t LoginThrottle::addressesSince() const {
    return std::int64_t{clock_.system()} - kAddressKnownFor;
}

std::string LoginThrottle::placeOf(const Login &login) {
    return keyOf({"address", OvraBase::clientKey(login.address)});
}

/// Milliseconds of the system clock of the start, unmoved by what was done to it since.
std::int64_t LoginThrottle::now() const {
    return begin_ + clock_.elapsed().count();
}

void LoginThrottle::giveFileUp() {
    fileFrom_ = now() + kFilePause.count();
    OVRA_ERR("The guesses at passwords are counted in memory for ten minutes, or until a restart: "
             "[%s] cannot be used",
             path_.c_str());
}

void LoginThrottle::recall() {
    std::unordered_map<std::string, std::int64_t> known;
    Database file(path_, kLayout);
    if (file.isOpen()) {
        Statement row = file.prepare("SELECT account, client, used FROM known");
        while (row.step()) {
            known[row.text(0) + row.text(1)] = row.number(2);
        }
    }
    const std::lock_guard lock(knownMutex_);
    known_ = std::move(known);
}

bool LoginThrottle::knows(const Login &login) const {
    const std::string account = keyOf({login.account});
    const std::lock_guard lock(knownMutex_);
    const auto isIn = [&](const std::string &client, std::int64_t since) {
        const auto found = known_.find(account + client);
        return found != known_.end() && found->second > since;
    };
    return isIn(keyOf({"device", login.device}), 0) || isIn(placeOf(login), addressesSince());
}

void LoginThrottle::learn(const std::string &account, const std::string &client,
                          std::int64_t used) {
    std::unique_lock lock(knownMutex_);
    known_[account + client] = used;
    if (known_.size() > std::size_t{2} * kMaxKnownOfAll) {
        lock.unlock();
        recall(); // without those that the file has forgotten
    }
}

/// Carries out the work in one transaction of the file, or in memory.
bool LoginThrottle::change(const std::function<bool(Database &)> &work) {
    const auto done = [&work](Database &database) {
        OvraPlatform::Transaction transaction(database);
        return transaction.isOpen() && work(database) && transaction.commit();
    };
    const std::lock_guard lock(mutex_);
    if (now() >= fileFrom_) {
        Database file(path_, kLayout);
        if (file.isOpen() && done(file)) {
            return true;
        }
        giveFileUp();
    }
    if (!memory_) {
        memory_.emplace(OvraPlatform::kInMemory, kLayout);
    }
    return done(*memory_);
}

tl::expected<LoginThrottle::Attempt, std::chrono::seconds>
LoginThrottle::admit(const Login &login) {
    Attempt attempt;
    milliseconds wait{};
    const bool done = change([&](Database &database) {
        attempt.charges_.clear();
        return admitIn(database, login, attempt, wait);
    });
    if (!done) {
        wait = milliseconds(kMinute); // no memory
    }
    if (wait.count() > 0) {
        return tl::unexpected(std::chrono::ceil<std::chrono::seconds>(wait));
    }
    return attempt;
}

/// \param wait  0: it is admitted
/// \return false if the database failed.
bool LoginThrottle::admitIn(Database &database, const Login &login, Attempt &attempt,
                            milliseconds &wait) const {
    const Budget pool{kPoolBurst, kPoolInterval};
    const Budget client{kClientBurst, kClientInterval};
    const Budget stranger{kStrangerBurst, kStrangerInterval};
    const std::string account = keyOf({login.account});
    const std::string place = placeOf(login);
    const std::string device = keyOf({"device", login.device});
    const std::int64_t time = now();
    if (!bound(database, time)) {
        return false;
    }

    // The budgets of each way in which it may be admitted.
    std::vector<std::vector<Use>> ways;
    for (const auto &[own, from] :
         {std::pair(device, std::int64_t{0}), std::pair(place, addressesSince())}) {
        if (isKnown(database, account, own, from)) {
            ways.push_back({{keyOf({account, own}), client}, {keyOf({account, "known"}), pool}});
        }
    }
    ways.push_back({{keyOf({account, place}), client},
                    {keyOf({account, "strangers"}), pool},
                    {place, stranger}});

    wait = milliseconds::max();
    for (const std::vector<Use> &way : ways) {
        milliseconds longest{};
        std::vector<std::int64_t> then;
        for (const Use &use : way) {
            Statement row = database.prepare("SELECT free FROM budget WHERE key = ?1");
            row.bindBlob(1, use.key);
            const std::int64_t stored = row.step() ? row.number(0) : time;
            const std::int64_t free = std::clamp(stored, time, time + use.budget.most());
            then.push_back(free + use.budget.interval);
            longest = std::max(longest, milliseconds(then.back() - use.budget.most() - time));
        }
        wait = std::min(wait, longest);
        if (longest.count() > 0) {
            continue;
        }
        for (std::size_t i = 0; i < way.size(); ++i) {
            if (!database.prepare("INSERT OR REPLACE INTO budget VALUES (?1, ?2)")
                     .bindBlob(1, way[i].key)
                     .bind(2, then[i])
                     .run()) {
                return false;
            }
            attempt.charges_.push_back({way[i].key, way[i].budget.interval});
        }
        return sweep(database, time);
    }
    return !database.failed();
}

bool LoginThrottle::isKnown(Database &database, const std::string &account,
                            const std::string &client, std::int64_t since) {
    Statement row =
        database.prepare("SELECT 1 FROM known WHERE account = ?1 AND client = ?2 AND used > ?3");
    row.bindBlob(1, account).bindBlob(2, client).bind(3, since);
    return row.step();
}

/// What lies farther ahead than any use reaches was noted under another clock.
bool LoginThrottle::bound(Database &database, std::int64_t now) {
    constexpr std::int64_t kMost = kPoolBurst * kPoolInterval;
    static_assert(kMost >= kClientBurst * kClientInterval &&
                  kMost >= kStrangerBurst * kStrangerInterval);
    return database.prepare("UPDATE budget SET free = ?1 WHERE free > ?1")
        .bind(1, now + kMost)
        .run();
}

/// Forgets budgets that are free, which is what an absent one is, and keeps the table small.
bool LoginThrottle::sweep(Database &database, std::int64_t now) {
    return database.prepare("DELETE FROM budget WHERE free <= ?1").bind(1, now).run() &&
           database
               .prepare("DELETE FROM budget WHERE key IN (SELECT key FROM budget ORDER BY free "
                        "LIMIT max(0, (SELECT count(*) FROM budget) - ?1))")
               .bind(1, kMaxBudgets)
               .run();
}

bool LoginThrottle::refund(Database &database, const Attempt &attempt) {
    return std::all_of(attempt.charges_.begin(), attempt.charges_.end(),
                       [&database](const Attempt::Charge &charge) {
                           return database
                               .prepare("UPDATE budget SET free = free - ?2 WHERE key = ?1")
                               .bindBlob(1, charge.key)
                               .bind(2, charge.cost)
                               .run();
                       });
}

bool LoginThrottle::remember(Database &database, const std::string &account,
                             const std::string &client, std::int64_t now) {
    // A time in the future was noted under another clock and would stay for ever.
    return database.prepare("UPDATE known SET used = ?2 WHERE account = ?1 AND used > ?2")
               .bindBlob(1, account)
               .bind(2, now)
               .run() &&
           database.prepare("INSERT OR REPLACE INTO known VALUES (?1, ?2, ?3)")
               .bindBlob(1, account)
               .bindBlob(2, client)
               .bind(3, now)
               .run() &&
           database
               .prepare("DELETE FROM known WHERE account = ?1 AND client NOT IN (SELECT client "
                        "FROM known WHERE account = ?1 ORDER BY used DESC LIMIT ?2)")
               .bindBlob(1, account)
               .bind(2, kMaxKnown)
               .run() &&
           database
               .prepare("DELETE FROM known WHERE (account, client) IN (SELECT account, client FROM "
                        "known ORDER BY used LIMIT max(0, (SELECT count(*) FROM known) - ?1))")
               .bind(1, kMaxKnownOfAll)
               .run();
}

void LoginThrottle::withdraw(const Attempt &attempt) {
    (void)change([&attempt](Database &database) { return refund(database, attempt); });
}

void LoginThrottle::recordSuccess(const Login &login, const Attempt &attempt) {
    const std::int64_t time = clock_.system();
    const std::string account = keyOf({login.account});
    std::vector<std::string> clients;
    if (!login.address.empty()) {
        clients.push_back(placeOf(login));
    }
    if (!login.device.empty()) {
        clients.push_back(keyOf({"device", login.device}));
    }
    (void)change([&](Database &database) {
        return refund(database, attempt) &&
               std::all_of(clients.begin(), clients.end(), [&](const std::string &client) {
                   return remember(database, account, client, time);
               });
    });
    for (const std::string &client : clients) {
        learn(account, client, time);
    }
}

} // namespace Ovradrd
