// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <utility>

namespace Ovradrd {

/// The log lines of refused calls (rights, sessions, seals), so that nobody can flood the log with
/// them: of one client and error code the first ones of a minute in full, and at its end how many
/// more there were. Thread-safe.
class RefusalLog {
public:
    using Clock = std::function<std::chrono::steady_clock::time_point()>;

    static constexpr std::size_t kInFull = 5;
    static constexpr std::chrono::seconds kPeriod{60};
    /// Clients and codes that are told apart in a minute; the others are counted together.
    static constexpr std::size_t kMaxEntries = 256;

    explicit RefusalLog(Clock clock = [] { return std::chrono::steady_clock::now(); });

    /// \param address  of the client, see OvraBase::clientKey()
    /// \param what     the call, as the line shows it
    void note(const std::string &address, int code, const std::string &what);
    /// Writes what is due of the numbers that were not shown. Call it now and then.
    void tell();

private:
    using Key = std::pair<std::string, int>;

    void tellLocked(std::chrono::steady_clock::time_point now);

    const Clock clock_;
    std::mutex mutex_;
    std::chrono::steady_clock::time_point begun_; ///< the minute
    std::map<Key, std::size_t> counts_;
};

} // namespace Ovradrd
