// SPDX-License-Identifier: Apache-2.0
#include "login_throttle.h"

#include <ovrabase/address.h>

#include <algorithm>
#include <array>
#include <utility>

namespace Ovradrd {

namespace {

constexpr int kFreeFailures = 3;
constexpr std::chrono::milliseconds kFirstDelay{250};
constexpr int kDoublings = 5; // 0.25 s to 8 s
constexpr int kMaxFailures = 16;
constexpr std::chrono::seconds kDecay{60};

std::chrono::milliseconds delayAfter(int failures) {
    if (failures < kFreeFailures) {
        return std::chrono::milliseconds{0};
    }
    return kFirstDelay * (1 << std::min(failures - kFreeFailures, kDoublings));
}

} // namespace

LoginThrottle::LoginThrottle(Clock clock)
    : clock_(std::move(clock)) {}

void LoginThrottle::dropSmallest(Entries &entries, TimePoint now) {
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
            dropSmallest(entries, now);
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
    const std::array<Entry *, 2> entries = {
        &entryOf(accounts_, account, now), &entryOf(addresses_, OvraBase::clientKey(address), now)};
    TimePoint begin = now;
    for (const Entry *entry : entries) {
        const auto delay = delayAfter(entry->failures);
        if (delay.count() > 0) {
            begin = std::max(begin, entry->begun + delay);
        }
    }
    const auto wait = std::chrono::ceil<std::chrono::milliseconds>(begin - now);
    if (wait > kMaxWait) {
        return std::nullopt;
    }
    for (Entry *entry : entries) {
        entry->failures = std::min(entry->failures + 1, kMaxFailures);
        entry->begun = begin;
    }
    return wait;
}

void LoginThrottle::undoFailure(Entries &entries, const std::string &key) {
    const auto found = entries.find(key);
    if (found != entries.end() && found->second.failures > 0) {
        --found->second.failures;
    }
}

void LoginThrottle::withdraw(const std::string &account, const std::string &address) {
    const std::lock_guard lock(mutex_);
    undoFailure(accounts_, account);
    undoFailure(addresses_, OvraBase::clientKey(address));
}

void LoginThrottle::recordSuccess(const std::string &account, const std::string &address) {
    const std::lock_guard lock(mutex_);
    accounts_.erase(account);
    undoFailure(addresses_, OvraBase::clientKey(address));
}

} // namespace Ovradrd
