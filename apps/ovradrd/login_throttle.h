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
/// 8 s. A minute takes one failure back.
///
/// Log-ins that come at once get places behind each other, so that many connections guess no faster
/// than one; who would must wait longer than kMaxWait is turned away. Nothing is kept when the
/// process ends. All operations are safe for threads.
class LoginThrottle {
public:
    using TimePoint = std::chrono::steady_clock::time_point;
    using Clock = std::function<TimePoint()>;

    static constexpr std::chrono::milliseconds kMaxWait{16000};
    /// Accounts, and addresses, that are remembered; then those with the fewest failures go.
    static constexpr std::size_t kMaxEntries = 4096;

    explicit LoginThrottle(Clock clock = std::chrono::steady_clock::now);

    /// Asks for a log-in. It counts as failed until forgive() or succeeded() says otherwise.
    /// \return how long to wait before the password is checked; nothing: refuse it unchecked (it is
    ///         then not counted).
    std::optional<std::chrono::milliseconds> admit(const std::string &account,
                                                   const std::string &address);
    /// The log-in was no guess: it lacked the one-time code only, or could not be checked.
    void forgive(const std::string &account, const std::string &address);
    /// The log-in was right: the failures of the account are forgotten. Those of the address stay:
    /// an account of one's own must not pay for guessing others.
    void succeeded(const std::string &account, const std::string &address);

private:
    struct Entry {
        int failures = 0;
        TimePoint counted; ///< up to when failures have been taken back
        TimePoint begun;   ///< when the log-in admitted last begins
    };
    using Entries = std::map<std::string, Entry>;

    static Entry &entryOf(Entries &entries, const std::string &key, TimePoint now);
    static void makeRoom(Entries &entries, TimePoint now);
    static void takeBack(Entries &entries, const std::string &key);

    Clock clock_;
    std::mutex mutex_;
    Entries accounts_;
    Entries addresses_;
};

} // namespace Ovradrd
