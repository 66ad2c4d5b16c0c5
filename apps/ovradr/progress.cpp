// SPDX-License-Identifier: Apache-2.0
#include "progress.h"

#include "output.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdio>

namespace Ovradr {

namespace {

constexpr std::chrono::seconds kStep{1};
constexpr const char *kClearLine = "\r\x1b[K"; // ECMA-48, EL

} // namespace

Progress::Progress()
    : screen_(fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1))
    , caught_(memfd_create("ovradr", MFD_CLOEXEC))
    , terminal_(isatty(STDERR_FILENO) != 0) {
    if (screen_ >= 0 && caught_ >= 0) {
        std::fflush(stderr);
        dup2(caught_, STDERR_FILENO);
    }
    if (terminal_) {
        thread_ = std::thread([this] { show(); });
    }
}

Progress::~Progress() {
    {
        const std::lock_guard lock(mutex_);
        stop_ = true;
    }
    changed_.notify_all();
    if (thread_.joinable()) {
        thread_.join();
    }
    if (screen_ >= 0) {
        dup2(screen_, STDERR_FILENO);
        close(screen_);
    }
    if (caught_ >= 0) {
        close(caught_);
    }
}

void Progress::say(const std::string &what) {
    {
        const std::lock_guard lock(mutex_);
        what_ = printable(what);
        seconds_ = 0;
    }
    changed_.notify_all();
}

std::string Progress::caught() const {
    std::array<char, 4096> buffer{};
    const off_t size = lseek(caught_, 0, SEEK_END);
    const off_t from = size > static_cast<off_t>(buffer.size()) ? size - 4096 : 0;
    const ssize_t count = pread(caught_, buffer.data(), buffer.size(), from);
    std::string text(buffer.data(), count > 0 ? static_cast<std::size_t>(count) : 0);
    text.erase(text.find_last_not_of('\n') + 1);
    return text.substr(text.rfind('\n') + 1);
}

void Progress::show() {
    std::unique_lock lock(mutex_);
    while (!stop_) {
        if (!what_.empty()) {
            dprintf(screen_, "%s%s, %d s", kClearLine, what_.c_str(), seconds_);
        }
        const std::string before = what_;
        if (changed_.wait_for(lock, kStep) == std::cv_status::timeout && what_ == before) {
            ++seconds_;
        }
    }
    dprintf(screen_, "%s", kClearLine);
}

} // namespace Ovradr
