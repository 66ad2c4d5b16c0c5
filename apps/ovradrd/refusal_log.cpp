// SPDX-License-Identifier: Apache-2.0
#include "refusal_log.h"

#include <ovrabase/address.h>
#include <ovradrcore/log.h>

namespace Ovradrd {

namespace {

constexpr char kOthers[] = "other clients";

} // namespace

RefusalLog::RefusalLog(Clock clock)
    : clock_(std::move(clock))
    , begun_(clock_()) {}

void RefusalLog::note(const std::string &address, int code, const std::string &what) {
    const std::lock_guard lock(mutex_);
    tellLocked(clock_());
    Key key(OvraBase::clientKey(address), code);
    if (counts_.size() >= kMaxEntries && counts_.count(key) == 0) {
        key.first = kOthers;
    }
    if (++counts_[key] <= kInFull) {
        OVRA_NOTICE("%s from [%s] was refused with [%d]", what.c_str(), address.c_str(), code);
    }
}

void RefusalLog::tell() {
    const std::lock_guard lock(mutex_);
    tellLocked(clock_());
}

void RefusalLog::tellLocked(std::chrono::steady_clock::time_point now) {
    if (now - begun_ < kPeriod) {
        return;
    }
    for (const auto &[key, count] : counts_) {
        if (count > kInFull) {
            OVRA_NOTICE("[%zu] more calls from [%s] were refused with [%d] in a minute",
                        count - kInFull, key.first.c_str(), key.second);
        }
    }
    counts_.clear();
    begun_ = now;
}

} // namespace Ovradrd
