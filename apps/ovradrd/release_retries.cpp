// SPDX-License-Identifier: Apache-2.0
#include "release_retries.h"

#include "shared/session_release.h"

#include <vector>

namespace Ovradrd {

namespace {

/// A node that lets packets vanish takes 10 seconds.
constexpr int kMaxInARound = 8;

} // namespace

void ReleaseRetries::begin() {
    if (underWay_.exchange(true)) {
        return;
    }
    const auto job = [this] {
        try {
            round();
        } catch (...) {
            underWay_ = false;
            throw;
        }
        underWay_ = false;
    };
    if (!queue_.submit("", job)) {
        underWay_ = false;
    }
}

void ReleaseRetries::round() {
    OvraApps::PendingReleases store;
    std::vector<OvraApps::PendingRelease> due;
    if (!store.listDue(due, kMaxInARound)) {
        return; // the log says why
    }
    for (const OvraApps::PendingRelease &pending : due) {
        OvraApps::retryRelease(pending, store);
    }
}

} // namespace Ovradrd
