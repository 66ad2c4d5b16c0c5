// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>

namespace OvraService {

/// A fixed number of threads with a bounded queue before them: one kind of work cannot take what
/// another kind needs, and more work than fits is refused at once instead of piling up.
class WorkQueue {
public:
    using Job = std::function<void()>;
    using TimePoint = std::chrono::steady_clock::time_point;

    /// \param capacity  how many jobs may wait
    WorkQueue(unsigned int threads, std::size_t capacity);
    WorkQueue(const WorkQueue &) = delete;
    WorkQueue &operator=(const WorkQueue &) = delete;
    /// Stops, and waits for the jobs in progress however long they take.
    ~WorkQueue();

    /// Hands over a job. It runs once, in a thread of the queue; what it throws is logged.
    /// \param delay  for how long it waits in the queue at least; no thread waits with it
    /// \return false if the queue is full or the queue stops; the job does not run then.
    [[nodiscard]] bool submit(Job job, std::chrono::milliseconds delay = {});

    /// Takes no more jobs and drops the waiting ones.
    /// \return whether all jobs in progress ended by `deadline`.
    bool stop(TimePoint deadline);

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace OvraService
