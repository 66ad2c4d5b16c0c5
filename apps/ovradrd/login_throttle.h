// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <chrono>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>

namespace Ovradrd {

/// Slows down the guessing of passwords and one-time codes, per account and per client address (an
/// IPv6 client's /64 network). Three failures are free; from then on log-ins of that account, or of
/// that address, begin at least 0.25 s apart, and the time doubles with every further failure up to
/// 8 s. One failure is forgiven per minute.
///
/// Simultaneous log-ins queue up, so that many connections guess no faster than one; one that would
/// wait longer than kMaxWait is refused. Nothing survives the process. Thread-safe.
class LoginThrottle {
public:
    using TimePoint = std::chrono::steady_clock::time_point;
    using Clock = std::function<TimePoint()>;

    static constexpr std::chrono::milliseconds kMaxWait{16000};
    /// How many accounts, and addresses, are remembered; beyond that, those with the fewest
    /// failures are dropped.
    static constexpr std::size_t kMaxEntries = 4096;

    explicit LoginThrottle(Clock clock = std::chrono::steady_clock::now);

    /// Asks for a log-in. It counts as failed until withdraw() or recordSuccess() says otherwise.
    /// \return how long to wait before the password is checked; std::nullopt: refuse it unchecked
    ///         (then it is not counted).
    std::optional<std::chrono::milliseconds> admit(const std::string &account,
                                                   const std::string &address);
    /// The log-in was no guess: it lacked the one-time code only, or could not be checked.
    void withdraw(const std::string &account, const std::string &address);
    /// The log-in was right: the failures of the account are forgotten. Those of the address stay,
    /// so that a log-in to one's own account does not pay for guessing others.
    void recordSuccess(const std::string &account, const std::string &address);

private:
    struct Entry {
        int failures = 0;
        TimePoint counted; ///< failures are forgiven up to this time
        TimePoint begun;   ///< when the last admitted log-in begins
    };
    using Entries = std::map<std::string, Entry>;

    static Entry &entryOf(Entries &entries, const std::string &key, TimePoint now);
    static void dropSmallest(Entries &entries, TimePoint now);
    static void undoFailure(Entries &entries, const std::string &key);

    Clock clock_;
    std::mutex mutex_;
    Entries accounts_;
    Entries addresses_;
};

} // namespace Ovradrd
