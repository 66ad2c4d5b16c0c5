// SPDX-License-Identifier: Apache-2.0
#include "ovracore/ovracore.h"

#include <ovrabase/file.h>
#include <ovrabase/unique_fd.h>
#include <ovradrcore/log.h>
#include <ovradrcore/no_fork.h>

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <map>
#include <mutex>
#include <string_view>
#include <utility>
#include <vector>

namespace OvraPlatform {

namespace {

constexpr std::size_t kMaxArguments = 255;

/// The program behind each stream. Never destroyed: a thread may still close a stream while the
/// process ends.
struct RunningPrograms {
    OvraDRCore::ForkSafeMutex mutex;
    std::map<FILE *, pid_t> pids;
};

RunningPrograms &runningPrograms() {
    const OvraDRCore::NoFork noFork; // a child would wait for an initialisation under way
    static auto *const programs = new RunningPrograms;
    return *programs;
}

/// What the program starts with: the pipe as its standard output (or input), the null device as the
/// standard input of one that is read from, no other descriptor of ours but standard error, and the
/// signals as a fresh process has them.
class SpawnPlan {
public:
    SpawnPlan() {
        posix_spawn_file_actions_init(&actions_);
        posix_spawnattr_init(&attributes_);
    }
    SpawnPlan(const SpawnPlan &) = delete;
    SpawnPlan &operator=(const SpawnPlan &) = delete;
    ~SpawnPlan() {
        posix_spawn_file_actions_destroy(&actions_);
        posix_spawnattr_destroy(&attributes_);
    }

    /// \return 0, or the errno that tells why not; `pid` is then unchanged.
    int run(const char *path, const std::vector<char *> &arguments, int pipeEnd, int standardFd,
            pid_t &pid) {
        sigset_t none;
        sigset_t all;
        sigemptyset(&none);
        sigfillset(&all);
        int error = posix_spawn_file_actions_adddup2(&actions_, pipeEnd, standardFd);
        if (error == 0 && standardFd == STDOUT_FILENO) {
            error =
                posix_spawn_file_actions_addopen(&actions_, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
        }
        if (error == 0) {
            error = posix_spawn_file_actions_addclosefrom_np(&actions_, STDERR_FILENO + 1);
        }
        if (error == 0) {
            error = posix_spawnattr_setsigmask(&attributes_, &none);
        }
        if (error == 0) {
            error = posix_spawnattr_setsigdefault(&attributes_, &all);
        }
        if (error == 0) {
            error = posix_spawnattr_setflags(&attributes_,
                                             POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
        }
        return error != 0
                   ? error
                   : posix_spawn(&pid, path, &actions_, &attributes_, arguments.data(), environ);
    }

private:
    posix_spawn_file_actions_t actions_{};
    posix_spawnattr_t attributes_{};
};

int waitForExit(pid_t pid) {
    int status = 0;
    pid_t ended = -1;
    do {
        ended = waitpid(pid, &status, 0);
    } while (ended < 0 && errno == EINTR);
    return ended == pid ? status : -1;
}

FILE *start(const char *path, const std::vector<char *> &arguments, bool read) {
    std::array<int, 2> ends{};
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
        OVRA_ERR("Cannot run [%s]: %s.", path, OvraBase::errnoText(errno).c_str());
        return nullptr;
    }
    const OvraBase::UniqueFd childEnd(ends[read ? 1 : 0]);
    OvraBase::UniqueFd ourEnd(ends[read ? 0 : 1]);
    pid_t pid = -1;
    const int error =
        SpawnPlan().run(path, arguments, childEnd.get(), read ? STDOUT_FILENO : STDIN_FILENO, pid);
    if (error != 0) {
        OVRA_ERR("Cannot run [%s]: %s. Check that it is there and executable.", path,
                 OvraBase::errnoText(error).c_str());
        return nullptr;
    }
    FILE *const stream = fdopen(ourEnd.get(), read ? "r" : "w");
    if (stream == nullptr) {
        OVRA_ERR("Cannot use the pipe of [%s]: %s.", path, OvraBase::errnoText(errno).c_str());
        kill(pid, SIGKILL);
        waitForExit(pid);
        return nullptr;
    }
    ourEnd.release(); // the stream closes it
    RunningPrograms &programs = runningPrograms();
    const std::lock_guard lock(programs.mutex);
    programs.pids[stream] = pid;
    return stream;
}

} // namespace

} // namespace OvraPlatform

FILE *OLIBCPopen(const char *path, const char *mode, ...) {
    const std::string_view direction = mode == nullptr ? "" : mode;
    if (path == nullptr || (direction != "r" && direction != "w")) {
        return nullptr;
    }
    // posix_spawn() takes the arguments as it would hand them to main(); it does not change them.
    std::vector<char *> arguments = {const_cast<char *>(path)};
    va_list list;
    va_start(list, mode);
    while (arguments.back() != nullptr && arguments.size() <= OvraPlatform::kMaxArguments) {
        arguments.push_back(va_arg(list, char *));
    }
    va_end(list);
    if (arguments.back() != nullptr) {
        OVRA_ERR("[%s] was given more than %zu arguments.", path, OvraPlatform::kMaxArguments - 1);
        return nullptr;
    }
    return OvraPlatform::start(path, arguments, direction == "r");
}

int OLIBCPclose(FILE *stream) {
    pid_t pid = -1;
    {
        OvraPlatform::RunningPrograms &programs = OvraPlatform::runningPrograms();
        const std::lock_guard lock(programs.mutex);
        const auto entry = programs.pids.find(stream);
        if (entry == programs.pids.end()) {
            return -1;
        }
        pid = entry->second;
        programs.pids.erase(entry);
    }
    fclose(stream);
    return OvraPlatform::waitForExit(pid);
}
