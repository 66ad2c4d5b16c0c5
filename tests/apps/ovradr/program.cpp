// SPDX-License-Identifier: Apache-2.0
#include "program.h"

#include <ovradrcore/json.h>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <pty.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>
#include <utmp.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <thread>

namespace OvradrTest {

namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;
using std::chrono::steady_clock;

constexpr int kCannotStart = 127;

int anonymousFile(const std::string &content = "") {
    const int fd = memfd_create("ovradr_test", MFD_CLOEXEC);
    EXPECT_EQ(write(fd, content.data(), content.size()), static_cast<ssize_t>(content.size()));
    lseek(fd, 0, SEEK_SET);
    return fd;
}

std::string contentOf(int fd) {
    std::string content(static_cast<std::size_t>(lseek(fd, 0, SEEK_END)), '\0');
    EXPECT_EQ(pread(fd, content.data(), content.size(), 0), static_cast<ssize_t>(content.size()));
    return content;
}

} // namespace

void execute(const Arguments &arguments) {
    const char *const other = std::getenv("OVRADR_PROGRAM");
    const char *const program = other != nullptr ? other : OVRADR_PROGRAM;
    std::vector<char *> argv{const_cast<char *>(program)}; // NOLINT: as execv(3) wants it
    for (const std::string &argument : arguments) {
        argv.push_back(const_cast<char *>(argument.c_str())); // NOLINT
    }
    argv.push_back(nullptr);
    std::signal(SIGINT, SIG_DFL); // nohup ignores it, for whatever it starts
    execv(program, argv.data());
    _exit(kCannotStart);
}

Json::Value Result::json() const {
    Json::Value document;
    return OvraDRCore::fromString(document, out) ? document : Json::Value();
}

Program::Program(const Arguments &arguments, const std::string &input)
    : out_(anonymousFile())
    , err_(anonymousFile()) {
    const int in = anonymousFile(input);
    pid_ = fork();
    if (pid_ == 0) {
        dup2(in, STDIN_FILENO);
        dup2(out_, STDOUT_FILENO);
        dup2(err_, STDERR_FILENO);
        execute(arguments);
    }
    close(in);
}

Program::~Program() {
    if (pid_ > 0) {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    close(out_);
    close(err_);
}

Result Program::finish() {
    const auto deadline = steady_clock::now() + seconds(30);
    int status = 0;
    pid_t ended = 0;
    while ((ended = waitpid(pid_, &status, WNOHANG)) == 0 && steady_clock::now() < deadline) {
        std::this_thread::sleep_for(milliseconds(2));
    }
    Result result;
    if (ended == pid_) {
        pid_ = -1;
        result.exit = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    result.out = contentOf(out_);
    result.err = contentOf(err_);
    return result;
}

Result run(const Arguments &arguments, const std::string &input) {
    return Program(arguments, input).finish();
}

Terminal::Terminal(const Arguments &arguments) {
    EXPECT_EQ(openpty(&master_, &slave_, nullptr, nullptr, nullptr), 0);
    pid_ = fork();
    if (pid_ == 0) {
        close(master_);
        login_tty(slave_);
        std::signal(SIGINT, SIG_DFL); // inherited as ignored if the tests run in the background
        execute(arguments);
    }
}

Terminal::~Terminal() {
    if (pid_ > 0) {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    close(master_);
    close(slave_);
}

bool Terminal::readOn() {
    pollfd ready{master_, POLLIN, 0};
    std::array<char, 4096> buffer{};
    if (poll(&ready, 1, 20) <= 0) {
        return false;
    }
    const ssize_t count = read(master_, buffer.data(), buffer.size());
    if (count > 0) {
        screen_.append(buffer.data(), static_cast<std::size_t>(count));
    }
    return count > 0;
}

bool Terminal::shows(const std::string &text) {
    const auto deadline = steady_clock::now() + seconds(10);
    std::size_t found = std::string::npos;
    while ((found = screen_.find(text, seen_)) == std::string::npos) {
        if (!readOn() && steady_clock::now() > deadline) {
            return false;
        }
    }
    seen_ = found + text.size();
    return true;
}

void Terminal::type(const std::string &text) const {
    EXPECT_EQ(write(master_, text.data(), text.size()), static_cast<ssize_t>(text.size()));
}

bool Terminal::echoes() const {
    termios settings{};
    return tcgetattr(slave_, &settings) == 0 && (settings.c_lflag & ECHO) != 0;
}

int Terminal::finish() {
    const auto deadline = steady_clock::now() + seconds(30);
    int status = 0;
    while (waitpid(pid_, &status, WNOHANG) == 0) {
        readOn();
        if (steady_clock::now() > deadline) {
            ADD_FAILURE() << "still running: " << screen_;
            return 0;
        }
    }
    pid_ = -1;
    while (readOn()) {
    }
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

std::string readFile(const std::string &path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void writeFile(const std::string &path, const std::string &content) {
    std::ofstream(path, std::ios::binary) << content;
}

} // namespace OvradrTest
