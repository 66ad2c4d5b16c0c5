// SPDX-License-Identifier: Apache-2.0
#include "service/work_queue.h"

#include <ovrabase/secret.h>
#include <ovradrcore/log.h>

#include <condition_variable>
#include <exception>
#include <map>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

namespace OvraService {

struct WorkQueue::Impl {
    explicit Impl(std::size_t most)
        : capacity(most) {}

    void work();
    /// Waits for the next due job; an empty one if the queue stops.
    Job take(std::unique_lock<std::mutex> &lock);

    const std::size_t capacity;
    std::mutex mutex;
    std::condition_variable jobsChanged;
    std::condition_variable jobEnded;
    std::multimap<TimePoint, Job> waiting; ///< by the time at which each is due
    unsigned int running = 0;
    bool stopping = false;
    std::vector<std::thread> threads;
};

WorkQueue::Job WorkQueue::Impl::take(std::unique_lock<std::mutex> &lock) {
    while (!stopping) {
        if (waiting.empty()) {
            jobsChanged.wait(lock);
            continue;
        }
        const auto next = waiting.begin();
        if (next->first > std::chrono::steady_clock::now()) {
            const TimePoint due = next->first;
            jobsChanged.wait_until(lock, due);
            continue;
        }
        Job job = std::move(next->second);
        waiting.erase(next);
        if (!waiting.empty()) {
            // The thread woken for it may have been this one.
            jobsChanged.notify_one();
        }
        return job;
    }
    return {};
}

void WorkQueue::Impl::work() {
    std::unique_lock lock(mutex);
    while (Job job = take(lock)) {
        ++running;
        lock.unlock();
        try {
            job();
        } catch (const std::exception &error) {
            OVRA_ERR("A job failed: [%s]", error.what());
        }
        // What the job holds is released before it counts as ended.
        job = nullptr;
        OvraBase::wipeStack();
        lock.lock();
        --running;
        jobEnded.notify_all();
    }
}

WorkQueue::WorkQueue(unsigned int threads, std::size_t capacity)
    : impl_(std::make_unique<Impl>(capacity)) {
    try {
        for (unsigned int i = 0; i < threads; ++i) {
            impl_->threads.emplace_back([impl = impl_.get()] { impl->work(); });
        }
    } catch (...) {
        end();
        throw;
    }
}

WorkQueue::~WorkQueue() {
    end();
}

void WorkQueue::end() {
    stop({});
    for (std::thread &thread : impl_->threads) {
        thread.join();
    }
}

bool WorkQueue::submit(Job job, std::chrono::milliseconds delay) {
    {
        const std::lock_guard lock(impl_->mutex);
        if (impl_->stopping || impl_->waiting.size() >= impl_->capacity) {
            return false;
        }
        impl_->waiting.emplace(std::chrono::steady_clock::now() + delay, std::move(job));
    }
    impl_->jobsChanged.notify_one();
    return true;
}

bool WorkQueue::stop(TimePoint deadline) {
    std::multimap<TimePoint, Job> dropped;
    std::unique_lock lock(impl_->mutex);
    impl_->stopping = true;
    dropped.swap(impl_->waiting);
    impl_->jobsChanged.notify_all();
    // Another thread may wait for what a dropped job holds, or hold a lock that its destructor
    // takes.
    lock.unlock();
    dropped.clear();
    lock.lock();
    return impl_->jobEnded.wait_until(lock, deadline, [this] { return impl_->running == 0; });
}

} // namespace OvraService
