// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <chrono>
#include <mutex>

struct sqlite3;

/// Forking beside threads at work.
///
/// A child of fork(2) has one thread, and every lock that another thread of its parent held stays
/// locked in it for ever: those of SQLite, of the system log and of the TLS library, and our own.
/// So this library works on them only within a NoFork section, and a fork anywhere in the process
/// waits until no thread is in one. The gate is one per process, however many libraries use it.
///
/// Hence a child may use the library like a fresh process. Objects that the parent made before the
/// fork and that hold a connection to a database (SqliteDB and what derives from it) or have an
/// operation under way are not to be used in the child; a FileLock of the parent holds nothing
/// there. Connections that other threads are making at the moment of the fork stay open in the
/// child, unused, until it executes another program or ends.
namespace OvraDRCore {

/// A section during which no other thread forks. Cheap: two atomic additions to a number of the
/// process. It may be nested, and its thread itself may fork. Not for waiting: a fork waits at most
/// 5 seconds, then it goes ahead.
class OVRADRCORE_EXPORT NoFork {
public:
    NoFork() noexcept { enter(); }
    ~NoFork() { leave(); }
    NoFork(const NoFork &) = delete;
    NoFork &operator=(const NoFork &) = delete;

    /// What the constructor and the destructor do; the same thread calls both.
    static void enter() noexcept;
    static void leave() noexcept;

    /// Leaves all sections of this thread while it lives, so that forks can pass during a wait.
    class OVRADRCORE_EXPORT Pause {
    public:
        Pause() noexcept;
        ~Pause();
        Pause(const Pause &) = delete;
        Pause &operator=(const Pause &) = delete;

    private:
        unsigned int depth_;
    };
};

/// A mutex that a child never finds locked by a thread that it does not have. To be held briefly.
class ForkSafeMutex {
public:
    void lock() {
        NoFork::enter();
        mutex_.lock();
    }
    void unlock() {
        mutex_.unlock();
        NoFork::leave();
    }

private:
    std::mutex mutex_;
};

/// An open descriptor that a forked child closes at once, so that its copy keeps no lock of
/// flock(2) or fcntl(2) alive when the parent dies. In the child the object is empty.
class OVRADRCORE_EXPORT ForkClosedFd {
public:
    ForkClosedFd() = default;
    ~ForkClosedFd() { reset(); }
    ForkClosedFd(const ForkClosedFd &) = delete;
    ForkClosedFd &operator=(const ForkClosedFd &) = delete;

    /// -1 if empty.
    int get() const { return fd_; }
    explicit operator bool() const { return fd_ >= 0; }
    /// Closes what it has and takes `fd`; -1 for none. To leave no gap for a fork, open the
    /// descriptor in the same NoFork section.
    void reset(int fd = -1);

private:
    friend struct ForkGate;

    int fd_ = -1;
    ForkClosedFd *previous_ = nullptr;
    ForkClosedFd *next_ = nullptr;
};

/// Makes a SQLite connection wait for the locks of others. Forks pass during the wait, unless the
/// connection itself holds a lock of the file: a child would keep SQLite's note of it.
class OVRADRCORE_EXPORT SqliteWait {
public:
    /// \param database  outlived by this object
    SqliteWait(sqlite3 *database, std::chrono::milliseconds limit);
    SqliteWait(const SqliteWait &) = delete;
    SqliteWait &operator=(const SqliteWait &) = delete;

private:
    static int onBusy(void *self, int count);

    sqlite3 *database_;
    std::chrono::milliseconds limit_;
    std::chrono::steady_clock::time_point since_;
};

} // namespace OvraDRCore
