// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>

namespace OvraService {

/// A fixed number of threads with a bounded queue: one kind of work cannot starve another, and
/// excess work is refused at once instead of piling up.
class WorkQueue {
public:
    using Job = std::function<void()>;
    using TimePoint = std::chrono::steady_clock::time_point;

    /// Throws std::system_error if the threads cannot all be started.
    /// \param capacity  how many jobs may wait
    WorkQueue(unsigned int threads, std::size_t capacity);
    WorkQueue(const WorkQueue &) = delete;
    WorkQueue &operator=(const WorkQueue &) = delete;
    /// Stops, and waits for the jobs in progress however long they take.
    ~WorkQueue();

    /// Adds a job. It runs once, in a thread of the queue; exceptions are logged.
    /// \param delay  its minimum time in the queue; occupies no thread
    /// \return false if the queue is full or the queue stops; the job does not run then.
    [[nodiscard]] bool submit(Job job, std::chrono::milliseconds delay = {});

    /// Accepts no more jobs and drops the waiting ones.
    /// \return whether all jobs in progress ended by `deadline`.
    bool stop(TimePoint deadline);

private:
    void end();

    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace OvraService
