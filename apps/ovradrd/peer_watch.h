// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/work_queue.h"
#include "shared/overview.h"

#include <ovradrnode/dr_node.h>

#include <chrono>
#include <cstdint>
#include <map>
#include <mutex>
#include <set>
#include <string>

namespace Ovradrd {

/// Asks the nodes that credentials reach how they are, while somebody wants to know: from wake() on
/// for kInterest, each credential every kPause, and more rarely where there are so many that it
/// would be more than kMostPerSecond. What it learns is kept in memory, and the host name and the
/// other facts of a node where every process of the appliance finds them. Thread-safe.
class PeerWatch {
public:
    static constexpr std::chrono::minutes kInterest{30};
    static constexpr std::chrono::seconds kPause{30};
    static constexpr std::size_t kMostPerSecond = 50;

    /// \param queue  where the questions run, each up to 20 seconds; must end before this object
    /// does
    explicit PeerWatch(OvraService::WorkQueue &queue)
        : queue_(queue) {}

    /// Somebody looks: questions that are due are asked from now on. Does not wait.
    void wake();
    /// Asks what is due, if somebody has looked of late. Call it now and then. Does not wait.
    void round();
    /// What was learnt, by credential id.
    std::map<std::string, OvraApps::WayFacts> facts() const;

private:
    using Clock = std::chrono::steady_clock;

    void scan();
    void ask(const OvraDRNode::DRNode &cred, bool temporary);
    void note(const std::string &credId, OvraApps::WayFacts found);

    OvraService::WorkQueue &queue_;
    mutable std::mutex mutex_;
    std::map<std::string, OvraApps::WayFacts> facts_;
    std::map<std::string, Clock::time_point> asked_; ///< by credential id: when it was last
    std::set<std::string> underWay_;
    bool scanning_ = false;
    Clock::time_point scanned_{};
    Clock::time_point interestEnds_{};
};

} // namespace Ovradrd
