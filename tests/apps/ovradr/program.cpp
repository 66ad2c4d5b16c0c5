// SPDX-License-Identifier: Apache-2.0
#include "program.h"

#include <ovradrcore/json.h>

#include <grp.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <pty.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>
#include <utmp.h>

#include <array>
#include <csignal>

namespace OvradrTest {

namespace {

int anonymousFile(const std::string &content = "") {
    const int fd = memfd_create("ovradr_test", MFD_CLOEXEC);
    EXPECT_EQ(pwrite(fd, content.data(), content.size(), 0), static_cast<ssize_t>(content.size()));
    return fd;
}

} // namespace

Arguments operator+(Arguments first, const Arguments &second) {
    first.insert(first.end(), second.begin(), second.end());
    return first;
}

Process::Process(const Arguments &arguments, const std::function<void()> &connect)
    : pid_(fork()) {
    if (pid_ == 0) {
        connect();
        std::vector<const char *> argv{OVRADR_PROGRAM};
        for (const std::string &argument : arguments) {
            argv.push_back(argument.c_str());
        }
        argv.push_back(nullptr);
        std::signal(SIGINT, SIG_DFL); // inherited as ignored if the tests run in the background
        alarm(60);
        execv(OVRADR_PROGRAM, const_cast<char **>(argv.data())); // NOLINT: as execv(3) wants it
        _exit(127);
    }
}

Process::~Process() {
    if (pid_ > 0) {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
}

int Process::wait(const std::function<void()> &meanwhile) {
    int status = 0;
    while (waitpid(pid_, &status, WNOHANG) == 0) {
        meanwhile();
    }
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

Json::Value Result::json() const {
    Json::Value document;
    return OvraDRCore::fromString(document, out) ? document : Json::Value();
}

Program::Program(const Arguments &arguments, const std::string &input,
                 const std::function<void()> &prepare)
    : streams_{anonymousFile(input), anonymousFile(), anonymousFile()}
    , process_(arguments, [this, &prepare] {
        for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
            dup2(streams_[static_cast<std::size_t>(fd)], fd);
        }
        prepare();
    }) {}

Program::~Program() {
    for (const int fd : streams_) {
        close(fd);
    }
}

Result Program::finish() {
    const int exit = process_.wait([] { usleep(2000); });
    const std::string folder = "/proc/self/fd/";
    return {exit, readFile(folder + std::to_string(streams_[1])),
            readFile(folder + std::to_string(streams_[2]))};
}

Result run(const Arguments &arguments, const std::string &input,
           const std::function<void()> &prepare) {
    return Program(arguments, input, prepare).finish();
}

Result runAsNobody(const Arguments &arguments) {
    constexpr unsigned int kNobody = 65534;
    return run(arguments, "", [] {
        if (setgroups(0, nullptr) != 0 || setgid(kNobody) != 0 || setuid(kNobody) != 0) {
            _exit(kNoOtherUser);
        }
    });
}

Terminal::Terminal(const Arguments &arguments) {
    const winsize size{24, 80, 0, 0};
    EXPECT_EQ(openpty(&master_, &slave_, nullptr, nullptr, &size), 0);
    process_.emplace(arguments, [this] { login_tty(slave_); });
}

Terminal::~Terminal() {
    close(master_);
    close(slave_);
}

bool Terminal::readOn(int milliseconds) {
    pollfd ready{master_, POLLIN, 0};
    std::array<char, 4096> buffer{};
    if (poll(&ready, 1, milliseconds) <= 0) {
        return false;
    }
    const ssize_t count = read(master_, buffer.data(), buffer.size());
    screen_.append(buffer.data(), count > 0 ? static_cast<std::size_t>(count) : 0);
    return count > 0;
}

bool Terminal::shows(const std::string &text) {
    std::size_t found = 0;
    while ((found = screen_.find(text, seen_)) == std::string::npos) {
        if (!readOn(10000)) {
            return false;
        }
    }
    seen_ = found + text.size();
    return true;
}

void Terminal::type(const std::string &text) const {
    EXPECT_EQ(write(master_, text.data(), text.size()), static_cast<ssize_t>(text.size()));
}

bool Terminal::answers(const std::string &question, const std::string &line) {
    const bool asked = shows(question);
    type(line + "\n");
    return asked;
}

bool Terminal::echoes() const {
    termios settings{};
    return tcgetattr(slave_, &settings) == 0 && (settings.c_lflag & ECHO) != 0;
}

int Terminal::finish() {
    const int exit = process_->wait([this] { readOn(20); });
    while (readOn(0)) {
    }
    return exit;
}

} // namespace OvradrTest
