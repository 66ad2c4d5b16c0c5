// SPDX-License-Identifier: Apache-2.0
#include "faults/faults.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/uio.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <string>
#include <string_view>

namespace {

namespace fs = std::filesystem;
using OvraTest::Fault;
using OvraTest::Lie;

enum class Call { kLook, kOpen, kChange, kWrite, kNetwork, kMemory };
enum class Verdict { kPass, kFail, kHalf, kLose };

constexpr const char *kDisk = "/usr/ovra";

OvraTest::FaultControl own;
OvraTest::FaultControl *control = &own;
OvraTest::FaultPlan &plan() {
    return control->plan;
}

bool isPower() {
    return plan().fault == Fault::kPowerNewNames || plan().fault == Fault::kPowerOldNames;
}

/// What is on the disk. Nothing that is opened to look is closed: that would drop the locks of
/// fcntl(2), and keep no inode from being used anew.
struct Disk {
    std::map<std::string, ino_t> names;
    std::map<ino_t, std::string> contents;
};
Disk *disk = nullptr; // ends with the process

ino_t inodeOf(const std::string &path) {
    struct stat status {};
    return open(path.c_str(), O_PATH) >= 0 && stat(path.c_str(), &status) == 0 ? status.st_ino : 0;
}

std::string contentOf(const std::string &path) {
    const int fd = open(path.c_str(), O_RDONLY);
    std::string text(fd < 0 ? 0 : static_cast<std::size_t>(lseek(fd, 0, SEEK_END)), '\0');
    return pread(fd, text.data(), text.size(), 0) < 0 ? std::string() : text;
}

std::map<std::string, ino_t> namesNow() {
    std::map<std::string, ino_t> names;
    for (const auto &entry : fs::recursive_directory_iterator(kDisk)) {
        if (entry.is_regular_file()) {
            names[entry.path()] = inodeOf(entry.path());
        }
    }
    return names;
}

void noteSync(int fd) {
    const std::string self = "/proc/self/fd/" + std::to_string(fd);
    const std::string path = fs::read_symlink(self);
    if (!fs::is_directory(self)) {
        disk->contents[inodeOf(self)] = contentOf(self);
        return;
    }
    const auto isIn = [&path](const auto &name) {
        return fs::path(name.first).parent_path() == path;
    };
    std::erase_if(disk->names, isIn);
    for (const auto &name : namesNow()) {
        if (isIn(name)) {
            disk->names.insert(name);
        }
    }
}

void losePower() {
    const auto now = namesNow();
    for (const auto &[path, inode] : now) {
        unlink(path.c_str());
    }
    for (const auto &[path, inode] : plan().fault == Fault::kPowerNewNames ? now : disk->names) {
        std::ofstream(path, std::ios::binary) << disk->contents[inode];
        chmod(path.c_str(), 0600);
    }
}

bool concerns(Call call) {
    const bool changes = call == Call::kChange || call == Call::kWrite;
    switch (plan().fault) {
    case Fault::kNoMemory:
    case Fault::kNoMemoryAtAll:
        return call == Call::kMemory;
    case Fault::kShort:
        return call == Call::kWrite;
    case Fault::kLost:
        return changes;
    case Fault::kError:
        return call != Call::kMemory && call != Call::kNetwork &&
               (plan().error == EIO || call == Call::kOpen || (plan().error == ENOSPC && changes));
    default:
        return call != Call::kMemory;
    }
}

Verdict judge(Call call) {
    if (!control->armed || !concerns(call)) {
        return Verdict::kPass;
    }
    const int left = --control->left;
    if (left > 0 || (left < 0 && plan().fault != Fault::kNoMemoryAtAll)) {
        return Verdict::kPass;
    }
    control->met = true;
    switch (plan().fault) {
    case Fault::kShort:
        return Verdict::kHalf;
    case Fault::kLost:
        return Verdict::kLose;
    case Fault::kError:
        errno = plan().error;
        return Verdict::kFail;
    case Fault::kNoMemory:
    case Fault::kNoMemoryAtAll:
        errno = ENOMEM;
        return Verdict::kFail;
    case Fault::kStop:
        raise(SIGSTOP);
        return Verdict::kPass;
    case Fault::kClock:
        return Verdict::kPass;
    default:
        control->armed = false;
        if (isPower()) {
            losePower();
        }
        raise(SIGKILL);
        return Verdict::kFail;
    }
}

template <typename Function>
Function *next(const char *name) {
    return reinterpret_cast<Function *>(dlsym(RTLD_NEXT, name));
}

bool isDropped(int fd) {
    if (!control->armed || plan().lie != Lie::kJournal) {
        return false;
    }
    control->armed = false;
    const bool journal =
        fs::read_symlink("/proc/self/fd/" + std::to_string(fd)).string().ends_with("-journal");
    control->armed = true;
    return journal;
}

template <typename Real, typename... Offset>
ssize_t writeTo(Real *real, int fd, const void *data, std::size_t size, Offset... offset) {
    const Verdict verdict = judge(Call::kWrite);
    if (verdict == Verdict::kLose || isDropped(fd)) {
        return static_cast<ssize_t>(size);
    }
    return verdict == Verdict::kFail
               ? -1
               : real(fd, data, verdict == Verdict::kHalf ? size / 2 : size, offset...);
}

int sync(int fd) {
    const Verdict verdict = judge(Call::kChange);
    if (control->armed && verdict == Verdict::kPass && plan().lie != Lie::kSync && isPower()) {
        control->armed = false;
        noteSync(fd);
        control->armed = true;
    }
    return verdict == Verdict::kFail ? -1 : 0;
}

bool isLock(int command) {
    return command == F_SETLK || command == F_SETLKW || command == F_OFD_SETLK ||
           command == F_OFD_SETLKW;
}

std::time_t secondsAhead() {
    return control->armed && control->met && plan().fault == Fault::kClock ? plan().error : 0;
}

/// Shares the control with the test that started this program.
__attribute__((constructor)) void shareControl() {
    const char *const name = getenv(OvraTest::kControlVariable); // NOLINT: no other thread yet
    const int fd = name != nullptr ? open(name, O_RDWR) : -1;
    void *const shared = mmap(nullptr, sizeof(own), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    if (fd >= 0 && shared != MAP_FAILED) {
        control = static_cast<OvraTest::FaultControl *>(shared);
    }
}

} // namespace

void OvraTest::beginFaults(const FaultPlan &what, int at) {
    plan() = what;
    control->left = at;
    control->met = false;
    if (isPower()) {
        disk = new Disk{namesNow(), {}};
        for (const auto &[path, inode] : disk->names) {
            disk->contents[inode] = contentOf(path);
        }
    }
    control->armed = true;
}

bool OvraTest::endFaults() {
    control->armed = false;
    if (isPower()) {
        losePower();
    }
    return control->met;
}

// Functions of libc, under names of our own: its headers declare them in ways that differ.
// NOLINTBEGIN(bugprone-macro-parentheses): the arguments are parts of declarations.
#define OVRA_REPLACE(result, name, parameters)                                                     \
    extern "C" __attribute__((visibility("default")))                                              \
    result ovra_##name parameters __asm__(#name);                                                  \
    result ovra_##name parameters
#define OVRA_COUNT(kind, result, name, parameters, arguments)                                      \
    OVRA_REPLACE(result, name, parameters) {                                                       \
        static result(*const real) parameters = next<result parameters>(#name);                    \
        const Verdict verdict = judge(Call::kind);                                                 \
        return verdict == Verdict::kPass                                                           \
                   ? real arguments                                                                \
                   : static_cast<result>(verdict == Verdict::kFail ? -1 : 0);                      \
    }
#define OVRA_LOCK(name, parameters, arguments, locks)                                              \
    OVRA_REPLACE(int, name, parameters) {                                                          \
        static int(*const real) parameters = next<int parameters>(#name);                          \
        const Verdict verdict = judge(Call::kLook);                                                \
        if (verdict == Verdict::kPass && (locks) && control->armed && plan().lie == Lie::kLock) {  \
            return usleep(200) * 0;                                                                \
        }                                                                                          \
        return verdict == Verdict::kPass ? real arguments : -1;                                    \
    }
#define OVRA_WRITE(name, parameters, ...)                                                          \
    OVRA_REPLACE(ssize_t, name, parameters) {                                                      \
        static ssize_t(*const real) parameters = next<ssize_t parameters>(#name);                  \
        return writeTo(real, __VA_ARGS__);                                                         \
    }
#define OVRA_ALLOCATE(name, real, parameters, arguments)                                           \
    extern "C" void *real parameters;                                                              \
    OVRA_REPLACE(void *, name, parameters) {                                                       \
        return judge(Call::kMemory) == Verdict::kPass ? real arguments : nullptr;                  \
    }

OVRA_COUNT(kOpen, int, open, (const char *path, int flags, mode_t mode), (path, flags, mode))
OVRA_COUNT(kOpen, int, open64, (const char *path, int flags, mode_t mode), (path, flags, mode))
OVRA_COUNT(kOpen, int, openat, (int at, const char *path, int flags, mode_t mode),
           (at, path, flags, mode))
OVRA_COUNT(kOpen, int, mkostemp, (char *path, int flags), (path, flags))
OVRA_COUNT(kLook, int, stat, (const char *path, struct stat *status), (path, status))
OVRA_COUNT(kLook, int, stat64, (const char *path, struct stat64 *status), (path, status))
OVRA_COUNT(kLook, int, lstat, (const char *path, struct stat *status), (path, status))
OVRA_COUNT(kLook, int, lstat64, (const char *path, struct stat64 *status), (path, status))
OVRA_COUNT(kLook, int, fstat, (int fd, struct stat *status), (fd, status))
OVRA_COUNT(kLook, int, fstat64, (int fd, struct stat64 *status), (fd, status))
OVRA_COUNT(kLook, int, access, (const char *path, int mode), (path, mode))
OVRA_COUNT(kLook, ssize_t, read, (int fd, void *data, std::size_t size), (fd, data, size))
OVRA_COUNT(kLook, ssize_t, pread, (int fd, void *data, std::size_t size, off_t at),
           (fd, data, size, at))
OVRA_COUNT(kLook, ssize_t, pread64, (int fd, void *data, std::size_t size, off_t at),
           (fd, data, size, at))
OVRA_COUNT(kChange, int, mkdir, (const char *path, mode_t mode), (path, mode))
OVRA_COUNT(kChange, int, mknod, (const char *path, mode_t mode, dev_t device), (path, mode, device))
OVRA_COUNT(kChange, int, chmod, (const char *path, mode_t mode), (path, mode))
OVRA_COUNT(kChange, int, fchmod, (int fd, mode_t mode), (fd, mode))
OVRA_COUNT(kChange, int, fchown, (int fd, uid_t user, gid_t group), (fd, user, group))
OVRA_COUNT(kChange, int, ftruncate, (int fd, off_t size), (fd, size))
OVRA_COUNT(kChange, int, ftruncate64, (int fd, off_t size), (fd, size))
OVRA_COUNT(kChange, int, unlink, (const char *path), (path))
OVRA_COUNT(kChange, int, link, (const char *from, const char *to), (from, to))
// NOLINTEND(bugprone-macro-parentheses)

OVRA_LOCK(flock, (int fd, int operation), (fd, operation), true)
OVRA_LOCK(fcntl, (int fd, int command, void *argument), (fd, command, argument), isLock(command))
OVRA_LOCK(fcntl64, (int fd, int command, void *argument), (fd, command, argument), isLock(command))
OVRA_WRITE(write, (int fd, const void *data, std::size_t size), fd, data, size)
OVRA_WRITE(pwrite, (int fd, const void *data, std::size_t size, off_t at), fd, data, size, at)
OVRA_WRITE(pwrite64, (int fd, const void *data, std::size_t size, off_t at), fd, data, size, at)
OVRA_ALLOCATE(malloc, __libc_malloc, (std::size_t size), (size))
OVRA_ALLOCATE(calloc, __libc_calloc, (std::size_t count, std::size_t size), (count, size))
OVRA_ALLOCATE(realloc, __libc_realloc, (void *old, std::size_t size), (old, size))

OVRA_COUNT(kNetwork, int, connect, (int fd, const sockaddr *to, socklen_t size), (fd, to, size))
OVRA_COUNT(kNetwork, ssize_t, send, (int fd, const void *data, std::size_t size, int flags),
           (fd, data, size, flags))
OVRA_COUNT(kNetwork, ssize_t, sendmsg, (int fd, const msghdr *message, int flags),
           (fd, message, flags))
OVRA_COUNT(kNetwork, ssize_t, recv, (int fd, void *data, std::size_t size, int flags),
           (fd, data, size, flags))
OVRA_COUNT(kNetwork, ssize_t, recvmsg, (int fd, msghdr *message, int flags), (fd, message, flags))

OVRA_REPLACE(int, clock_gettime, (clockid_t clock, timespec *time)) {
    static int (*const real)(clockid_t, timespec *) =
        next<int(clockid_t, timespec *)>("clock_gettime");
    const int result = real(clock, time);
    time->tv_sec += clock == CLOCK_REALTIME ? secondsAhead() : 0;
    return result;
}
OVRA_REPLACE(std::time_t, time, (std::time_t * out)) {
    timespec now{};
    ovra_clock_gettime(CLOCK_REALTIME, &now);
    return out != nullptr ? *out = now.tv_sec : now.tv_sec;
}
OVRA_REPLACE(int, gettimeofday, (timeval * time, void *)) {
    timespec now{};
    ovra_clock_gettime(CLOCK_REALTIME, &now);
    *time = {now.tv_sec, now.tv_nsec / 1000};
    return 0;
}

OVRA_REPLACE(int, fsync, (int fd)) {
    return sync(fd);
}
OVRA_REPLACE(int, fdatasync, (int fd)) {
    return sync(fd);
}
OVRA_REPLACE(int, rename, (const char *from, const char *to)) {
    static int (*const real)(const char *, const char *) =
        next<int(const char *, const char *)>("rename");
    const Verdict verdict = judge(Call::kChange);
    if (verdict == Verdict::kPass && control->armed && plan().lie == Lie::kRename) {
        const std::string text = contentOf(from);
        const int fd = open(to, O_WRONLY | O_CREAT | O_TRUNC, 0600);
        const bool copied = write(fd, text.data(), text.size()) >= 0;
        return close(fd) == 0 && copied ? unlink(from) : -1;
    }
    return verdict == Verdict::kPass ? real(from, to) : (verdict == Verdict::kFail ? -1 : 0);
}
