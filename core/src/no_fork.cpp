// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/no_fork.h"

#include <pthread.h>
#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <thread>

namespace OvraDRCore {

using std::chrono::microseconds;
using std::chrono::milliseconds;
using std::chrono::steady_clock;

namespace {

/// Sections last microseconds; one that takes longer is blocked on a disk or a log daemon, most
/// likely outside of every lock that a child would need.
constexpr std::chrono::seconds kMaxForkWait{5};

thread_local constinit unsigned int sections = 0; ///< of this thread, one in the other

} // namespace

/// The state of this process, and what happens around each fork of it.
struct ForkGate {
    std::atomic<unsigned int> inside{0}; ///< threads in a section
    std::atomic<bool> closed{false};     ///< a fork waits or is under way
    std::mutex turn;                     ///< held while the gate is closed
    ForkSafeMutex listMutex;
    ForkClosedFd *first = nullptr; ///< the descriptors that a child closes

    void enter() {
        inside.fetch_add(1);
        if (closed.load()) {
            inside.fetch_sub(1);
            // In turn with the forks: a stream of them does not keep this thread out.
            const std::lock_guard<std::mutex> lock(turn);
            inside.fetch_add(1);
        }
    }
    void leave() { inside.fetch_sub(1); }

    void add(ForkClosedFd &entry) {
        const std::lock_guard<ForkSafeMutex> lock(listMutex);
        entry.previous_ = nullptr;
        entry.next_ = first;
        if (first != nullptr) {
            first->previous_ = &entry;
        }
        first = &entry;
    }
    void remove(const ForkClosedFd &entry) {
        const std::lock_guard<ForkSafeMutex> lock(listMutex);
        (entry.previous_ != nullptr ? entry.previous_->next_ : first) = entry.next_;
        if (entry.next_ != nullptr) {
            entry.next_->previous_ = entry.previous_;
        }
    }

    void beforeFork() {
        if (sections != 0) {
            leave(); // this thread does not wait for itself
        }
        turn.lock();
        closed.store(true);
        const auto deadline = steady_clock::now() + kMaxForkWait;
        for (microseconds pause{20}; inside.load() != 0 && steady_clock::now() < deadline;
             pause = std::min(pause * 2, microseconds(1000))) {
            std::this_thread::sleep_for(pause);
        }
    }
    void inParent() {
        if (sections != 0) {
            inside.fetch_add(1);
        }
        closed.store(false);
        turn.unlock();
    }
    void inChild() {
        while (first != nullptr) {
            ForkClosedFd &entry = *first;
            first = entry.next_;
            close(entry.fd_);
            entry.fd_ = -1;
        }
        inside.store(sections != 0 ? 1 : 0);
        closed.store(false);
        turn.unlock();
    }
};

namespace {

constinit ForkGate gate;

[[maybe_unused]] const int registered =
    pthread_atfork([] { gate.beforeFork(); }, [] { gate.inParent(); }, [] { gate.inChild(); });

} // namespace

void NoFork::enter() noexcept {
    if (sections++ == 0) {
        gate.enter();
    }
}

void NoFork::leave() noexcept {
    if (--sections == 0) {
        gate.leave();
    }
}

NoFork::Pause::Pause() noexcept
    : depth_(sections) {
    if (sections != 0) {
        sections = 0;
        gate.leave();
    }
}

NoFork::Pause::~Pause() {
    if (depth_ != 0) {
        gate.enter();
        sections = depth_;
    }
}

void ForkClosedFd::reset(int fd) {
    const NoFork noFork;
    if (fd_ >= 0) {
        gate.remove(*this);
        close(fd_);
    }
    fd_ = fd;
    if (fd_ >= 0) {
        gate.add(*this);
    }
}

SqliteWait::SqliteWait(sqlite3 *database, milliseconds limit)
    : database_(database)
    , limit_(limit) {
    if (database != nullptr) {
        sqlite3_busy_handler(database, &SqliteWait::onBusy, this);
    }
}

int SqliteWait::onBusy(void *self, int count) {
    auto *wait = static_cast<SqliteWait *>(self);
    const auto now = steady_clock::now();
    if (count == 0) {
        wait->since_ = now;
    }
    if (now - wait->since_ >= wait->limit_) {
        return 0;
    }
    const milliseconds pause(std::min(1 + count, 20));
    if (sqlite3_txn_state(wait->database_, nullptr) == SQLITE_TXN_NONE) {
        const NoFork::Pause forksPass;
        std::this_thread::sleep_for(pause);
    } else {
        std::this_thread::sleep_for(pause);
    }
    return 1;
}

} // namespace OvraDRCore
