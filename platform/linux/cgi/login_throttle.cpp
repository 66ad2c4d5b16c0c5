// SPDX-License-Identifier: Apache-2.0
#include "cgi/login_throttle.h"

#include <arpa/inet.h>
#include <netinet/in.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <utility>

namespace OvraPlatform {

namespace {

constexpr int kFreeFailures = 3;
constexpr std::chrono::milliseconds kFirstDelay{250};
constexpr int kDoublings = 5; // 0.25 s to 8 s
constexpr int kMostFailures = 16;
constexpr std::chrono::seconds kDecay{60};

std::chrono::milliseconds delayAfter(int failures) {
    if (failures < kFreeFailures) {
        return std::chrono::milliseconds{0};
    }
    return kFirstDelay * (1 << std::min(failures - kFreeFailures, kDoublings));
}

/// One subscriber has a whole /64 of IPv6 addresses.
std::string networkOf(const std::string &address) {
    in6_addr binary{};
    if (inet_pton(AF_INET6, address.c_str(), &binary) != 1 || IN6_IS_ADDR_V4MAPPED(&binary) != 0) {
        return address;
    }
    std::memset(binary.s6_addr + 8, 0, 8);
    std::array<char, INET6_ADDRSTRLEN> text{};
    inet_ntop(AF_INET6, &binary, text.data(), text.size());
    return std::string(text.data()) + "/64";
}

} // namespace

LoginThrottle::LoginThrottle(Clock clock)
    : clock_(std::move(clock)) {}

void LoginThrottle::makeRoom(Entries &entries, TimePoint now) {
    std::erase_if(entries, [now](const auto &item) {
        return now - item.second.counted >= item.second.failures * kDecay;
    });
    while (entries.size() >= kMaxEntries) {
        entries.erase(std::min_element(
            entries.begin(), entries.end(), [](const auto &left, const auto &right) {
                return std::pair(left.second.failures, left.second.counted) <
                       std::pair(right.second.failures, right.second.counted);
            }));
    }
}

LoginThrottle::Entry &LoginThrottle::entryOf(Entries &entries, const std::string &key,
                                             TimePoint now) {
    auto found = entries.find(key);
    if (found == entries.end()) {
        if (entries.size() >= kMaxEntries) {
            makeRoom(entries, now);
        }
        found = entries.emplace(key, Entry{0, now, TimePoint::min()}).first;
    }
    Entry &entry = found->second;
    const auto decayed = (now - entry.counted) / kDecay;
    if (decayed >= entry.failures) {
        entry.failures = 0;
        entry.counted = now;
    } else {
        entry.failures -= static_cast<int>(decayed);
        entry.counted += decayed * kDecay;
    }
    return entry;
}

std::optional<std::chrono::milliseconds> LoginThrottle::admit(const std::string &account,
                                                              const std::string &address) {
    const TimePoint now = clock_();
    const std::lock_guard lock(mutex_);
    const std::array<Entry *, 2> entries = {&entryOf(accounts_, account, now),
                                            &entryOf(addresses_, networkOf(address), now)};
    TimePoint begin = now;
    for (const Entry *entry : entries) {
        const auto delay = delayAfter(entry->failures);
        if (delay.count() > 0) {
            begin = std::max(begin, entry->begun + delay);
        }
    }
    const auto wait = std::chrono::ceil<std::chrono::milliseconds>(begin - now);
    if (wait > kLongestWait) {
        return std::nullopt;
    }
    for (Entry *entry : entries) {
        entry->failures = std::min(entry->failures + 1, kMostFailures);
        entry->begun = begin;
    }
    return wait;
}

void LoginThrottle::takeBack(Entries &entries, const std::string &key) {
    const auto found = entries.find(key);
    if (found != entries.end() && found->second.failures > 0) {
        --found->second.failures;
    }
}

void LoginThrottle::forgive(const std::string &account, const std::string &address) {
    const std::lock_guard lock(mutex_);
    takeBack(accounts_, account);
    takeBack(addresses_, networkOf(address));
}

void LoginThrottle::succeeded(const std::string &account, const std::string &address) {
    const std::lock_guard lock(mutex_);
    accounts_.erase(account);
    takeBack(addresses_, networkOf(address));
}

} // namespace OvraPlatform
