// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <functional>
#include <thread>

namespace OvraTest {

/// Runs `work` in its own process, killed at the latest on destruction. It must not use gtest
/// assertions.
class OtherProcess {
public:
    explicit OtherProcess(const std::function<int()> &work)
        : pid_(fork()) {
        if (pid_ == 0) {
            _exit(work());
        }
    }
    OtherProcess(const OtherProcess &) = delete;
    OtherProcess &operator=(const OtherProcess &) = delete;
    ~OtherProcess() { end(SIGKILL); }

    pid_t pid() const { return pid_; }
    /// Its exit code; -1 if ended by a signal, or still running after 30 seconds.
    int wait() {
        int status = 0;
        const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(30);
        while (waitpid(pid_, &status, WNOHANG) == 0) {
            if (std::chrono::steady_clock::now() > end) {
                return -1;
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    void end(int signal) {
        if (pid_ > 0) {
            kill(pid_, signal);
            wait();
        }
    }

private:
    pid_t pid_;
};

} // namespace OvraTest
