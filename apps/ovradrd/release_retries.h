// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/work_queue.h"

#include <atomic>

namespace Ovradrd {

/// Tries again to release sessions on other nodes that could not be released before.
class ReleaseRetries {
public:
    /// \param queue  where the tries run; must end before this object does
    explicit ReleaseRetries(OvraService::WorkQueue &queue)
        : queue_(queue) {}

    /// Has what is due tried, unless the last round is still in progress. Returns at once.
    void begin();

private:
    void round();

    OvraService::WorkQueue &queue_;
    std::atomic<bool> underWay_ = false;
};

} // namespace Ovradrd
