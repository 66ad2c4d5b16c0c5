// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/work_queue.h"

#include <atomic>

namespace Ovradrd {

/// Tries again to release sessions on other nodes that could not be released before.
class ReleaseRetries {
public:
    /// \param queue  where the attempts run; must end before this object does
    explicit ReleaseRetries(OvraService::WorkQueue &queue)
        : queue_(queue) {}

    /// Queues the due attempts, unless the last round is still in progress. Returns at once.
    void begin();

private:
    void round();

    OvraService::WorkQueue &queue_;
    std::atomic<bool> underWay_ = false;
};

} // namespace Ovradrd
