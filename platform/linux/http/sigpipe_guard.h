// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <pthread.h>

#include <csignal>
#include <ctime>

namespace OvraPlatform {

/// Keeps SIGPIPE from this thread while it lives: a write to a TLS connection that the peer closed
/// raises it, and a library may not change how its process handles signals.
class SigpipeGuard {
public:
    SigpipeGuard() {
        sigset_t pending;
        sigemptyset(&sigpipe_);
        sigaddset(&sigpipe_, SIGPIPE);
        sigpending(&pending);
        wasPending_ = sigismember(&pending, SIGPIPE) == 1;
        pthread_sigmask(SIG_BLOCK, &sigpipe_, &before_);
    }
    SigpipeGuard(const SigpipeGuard &) = delete;
    SigpipeGuard &operator=(const SigpipeGuard &) = delete;
    ~SigpipeGuard() {
        if (!wasPending_) {
            const timespec noWait{};
            sigtimedwait(&sigpipe_, nullptr, &noWait);
        }
        pthread_sigmask(SIG_SETMASK, &before_, nullptr);
    }

private:
    sigset_t sigpipe_{};
    sigset_t before_{};
    bool wasPending_ = false;
};

} // namespace OvraPlatform
