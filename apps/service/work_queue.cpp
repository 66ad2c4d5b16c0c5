// SPDX-License-Identifier: Apache-2.0
#include "service/work_queue.h"

#include <ovrabase/secret.h>
#include <ovradrcore/log.h>

#include <algorithm>
#include <condition_variable>
#include <deque>
#include <exception>
#include <iterator>
#include <list>
#include <mutex>
#include <optional>
#include <thread>
#include <unordered_map>
#include <utility>
#include <vector>

namespace OvraService {

namespace {

/// How many threads one client may occupy: a quarter is left to the others.
unsigned int shareOf(unsigned int threads) {
    return threads > 1 ? threads - std::max(1U, threads / 4) : threads;
}

} // namespace

struct WorkQueue::Impl {
    struct Waiting {
        Job job;
        Job refuse;
    };
    struct Client {
        std::string name;
        std::deque<Waiting> waiting;
        unsigned int running = 0;
    };
    using Clients = std::list<Client>;

    Impl(unsigned int threadCount, const Limits &most)
        : limits(most)
        , share(shareOf(threadCount)) {}

    void work();
    Clients::iterator take(std::unique_lock<std::mutex> &lock, Job &job);
    Clients::iterator clientOf(const std::string &name);
    void forgetIdle(Clients::iterator client);
    std::optional<Waiting> makeRoom(const Client &client);

    const Limits limits;
    const unsigned int share;
    std::mutex mutex;
    std::condition_variable jobsChanged;
    std::condition_variable jobEnded;
    Clients clients; ///< with a job, in the order of their turns
    std::unordered_map<std::string, Clients::iterator> byName;
    std::size_t waiting = 0;
    unsigned int running = 0;
    bool stopping = false;
    std::vector<std::thread> threads;
};

WorkQueue::Impl::Clients::iterator WorkQueue::Impl::clientOf(const std::string &name) {
    const auto found = byName.find(name);
    if (found != byName.end()) {
        return found->second;
    }
    clients.push_back({name, {}, 0});
    return byName.emplace(name, std::prev(clients.end())).first->second;
}

void WorkQueue::Impl::forgetIdle(Clients::iterator client) {
    if (client->waiting.empty() && client->running == 0) {
        byName.erase(client->name);
        clients.erase(client);
    }
}

/// Waits for a job that may run, of the client whose turn it is. \return clients.end() if the queue
/// stops.
WorkQueue::Impl::Clients::iterator WorkQueue::Impl::take(std::unique_lock<std::mutex> &lock,
                                                         Job &job) {
    while (!stopping) {
        const auto next =
            std::find_if(clients.begin(), clients.end(), [this](const Client &client) {
                return !client.waiting.empty() && client.running < share;
            });
        if (next == clients.end()) {
            jobsChanged.wait(lock);
            continue;
        }
        job = std::move(next->waiting.front().job);
        next->waiting.pop_front();
        ++next->running;
        clients.splice(clients.end(), clients, next);
        if (--waiting > 0) {
            // The thread woken for it may have been this one.
            jobsChanged.notify_one();
        }
        return next;
    }
    return clients.end();
}

void WorkQueue::Impl::work() {
    std::unique_lock lock(mutex);
    Job job;
    for (auto client = take(lock, job); job; client = take(lock, job)) {
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
        --client->running;
        forgetIdle(client);
        jobEnded.notify_all();
    }
}

/// Takes the last job from the client with the most waiting ones, if it has more than `client`.
std::optional<WorkQueue::Impl::Waiting> WorkQueue::Impl::makeRoom(const Client &client) {
    const auto longest =
        std::max_element(clients.begin(), clients.end(), [](const Client &a, const Client &b) {
            return a.waiting.size() < b.waiting.size();
        });
    if (longest->waiting.size() <= client.waiting.size() + 1) {
        return std::nullopt;
    }
    Waiting victim = std::move(longest->waiting.back());
    longest->waiting.pop_back();
    --waiting;
    return victim;
}

WorkQueue::WorkQueue(unsigned int threads, const Limits &limits)
    : impl_(std::make_unique<Impl>(threads, limits)) {
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

bool WorkQueue::submit(const std::string &client, Job job, Job refuse) {
    std::optional<Impl::Waiting> victim; // outlives the lock: its destructor may take others
    {
        const std::lock_guard lock(impl_->mutex);
        if (impl_->stopping) {
            return false;
        }
        const auto owner = impl_->clientOf(client);
        bool room = owner->waiting.size() < impl_->limits.ofOneClient;
        if (room && impl_->waiting >= impl_->limits.total) {
            victim = impl_->makeRoom(*owner);
            room = victim.has_value();
        }
        if (!room) {
            impl_->forgetIdle(owner);
            return false;
        }
        owner->waiting.push_back({std::move(job), std::move(refuse)});
        ++impl_->waiting;
    }
    impl_->jobsChanged.notify_one();
    if (victim && victim->refuse) {
        victim->refuse();
    }
    return true;
}

bool WorkQueue::stop(TimePoint deadline) {
    std::vector<std::deque<Impl::Waiting>> dropped;
    std::unique_lock lock(impl_->mutex);
    impl_->stopping = true;
    for (Impl::Client &client : impl_->clients) {
        dropped.push_back(std::exchange(client.waiting, {}));
    }
    impl_->waiting = 0;
    impl_->jobsChanged.notify_all();
    // Another thread may wait for what a dropped job holds, or hold a lock that its destructor
    // takes.
    lock.unlock();
    dropped.clear();
    lock.lock();
    return impl_->jobEnded.wait_until(lock, deadline, [this] { return impl_->running == 0; });
}

} // namespace OvraService
