// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>

namespace OvraService {

/// A fixed number of threads with a bounded queue: one kind of work cannot starve another, and
/// excess work is refused at once instead of piling up.
///
/// Clients take turns, so that one with many jobs delays another's next job by one job at most; and
/// no client occupies all threads (but where there is only one).
class WorkQueue {
public:
    using Job = std::function<void()>;
    using TimePoint = std::chrono::steady_clock::time_point;

    /// How many jobs may wait.
    struct Limits {
        std::size_t total;
        std::size_t ofOneClient;
    };

    /// Throws std::system_error if the threads cannot all be started.
    WorkQueue(unsigned int threads, const Limits &limits);
    WorkQueue(const WorkQueue &) = delete;
    WorkQueue &operator=(const WorkQueue &) = delete;
    /// Stops, and waits for the jobs in progress however long they take.
    ~WorkQueue();

    /// Adds a job. It runs once, in a thread of the queue; exceptions are logged.
    /// \param client  whose turn it takes: what OvraBase::clientKey() makes of an address, or any
    ///                other name for work of our own
    /// \param refuse  run instead, in the thread of another submit(), if the job makes room in a
    /// full
    ///                queue: the last one of the client with the most waiting jobs does, but never
    ///                the only one of a client. May be empty
    /// \return false if too many jobs wait, or the queue stops; neither runs then.
    [[nodiscard]] bool submit(const std::string &client, Job job, Job refuse = {});

    /// Accepts no more jobs and drops the waiting ones.
    /// \return whether all jobs in progress ended by `deadline`.
    bool stop(TimePoint deadline);

private:
    void end();

    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace OvraService
