// SPDX-License-Identifier: Apache-2.0
#include "service/startup.h"

#include <ovradrcore/log.h>

#include <malloc.h>
#include <pthread.h>
#include <sys/resource.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <condition_variable>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <system_error>
#include <thread>

namespace OvraService {

namespace {

/// What a daemon has for its end; a stop waits a few seconds for calls in progress.
constexpr std::chrono::seconds kEndTime{10};

} // namespace

int reportStartError(const char *program, const StartError &why) {
    OVRA_ERR("%s does not start: %s", program, why.text.c_str());
    std::fprintf(stderr, "%s: %s\n", program, why.text.c_str());
    return static_cast<int>(why.exit);
}

int reportStartError(const char *program, const std::exception &why) {
    const auto *const system = dynamic_cast<const std::system_error *>(&why);
    const bool noThread =
        system != nullptr && system->code() == std::errc::resource_unavailable_try_again;
    return reportStartError(
        program, {ExitCode::kFailed,
                  noThread ? "the system refuses to start a thread: raise the limits of processes "
                             "and memory (ulimit -u, TasksMax= of the unit)"
                           : std::string(why.what())});
}

void openLog(const char *program) {
    const bool hasLog = access("/dev/log", F_OK) == 0; // _PATH_LOG, where syslog(3) writes
    openlog(program, LOG_NDELAY | (hasLog ? 0 : LOG_PERROR), LOG_DAEMON);
}

void raiseDescriptorLimit(unsigned long count) {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur >= count) {
        return;
    }
    limit.rlim_cur = std::min<rlim_t>(count, limit.rlim_max);
    if (setrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur < count) {
        OVRA_WARN("Only [%llu] descriptors are allowed, fewer than all connections need: raise "
                  "the limit of open files",
                  static_cast<unsigned long long>(limit.rlim_cur));
    }
}

void keepMemorySmall() {
#ifdef __GLIBC__
    // Large pieces, bodies and replies, come from the system and go back to it at once; a fixed
    // threshold is not raised by the first of them that is freed, as the default one is. Few
    // arenas, because each keeps its own freed memory; the environment may say otherwise
    // (mallopt(3)).
    // NOLINTBEGIN(concurrency-mt-unsafe): called before there are threads
    mallopt(M_MMAP_THRESHOLD, 128 * 1024);
    mallopt(M_TRIM_THRESHOLD, 1024 * 1024);
    if (std::getenv("MALLOC_ARENA_MAX") == nullptr) {
        mallopt(M_ARENA_MAX, 4);
    }
    // NOLINTEND(concurrency-mt-unsafe)
#endif
}

void returnFreedMemory() {
#ifdef __GLIBC__
    malloc_trim(0);
#endif
}

struct Signals::State {
    void give(Order next) {
        {
            const std::lock_guard lock(mutex);
            order = next;
        }
        changed.notify_all();
    }

    std::mutex mutex;
    std::condition_variable changed;
    Order order = Order::kNone;
};

Signals::Signals()
    : state_(std::make_shared<State>()) {
    std::signal(SIGPIPE, SIG_IGN);
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : {SIGTERM, SIGINT, SIGHUP}) {
        sigaddset(&signals, signal);
    }
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    std::thread([signals, state = state_] {
        for (int signal = 0; signal != SIGTERM && signal != SIGINT;) {
            signal = sigwaitinfo(&signals, nullptr);
            if (signal == SIGHUP) {
                state->give(Order::kReload);
            }
        }
        state->give(Order::kEnd);
        std::this_thread::sleep_for(kEndTime);
        alarm(1); // what does not end may be the system log
        OVRA_LOG_IN(OvraDRCore::LogLevel::kWarn, "Signals", "Something does not end: it is left");
        _exit(static_cast<int>(ExitCode::kFailed));
    }).detach();
}

Order Signals::wait(std::chrono::seconds atMost) const {
    std::unique_lock lock(state_->mutex);
    state_->changed.wait_for(lock, atMost, [this] { return state_->order != Order::kNone; });
    const Order order = state_->order;
    if (order == Order::kReload) {
        state_->order = Order::kNone;
    }
    return order;
}

} // namespace OvraService
