// SPDX-License-Identifier: Apache-2.0
#include "prompt.h"

#include "output.h"

#include <ovrabase/expected.h>
#include <ovrabase/unique_fd.h>
#include <ovrabase/utf8.h>

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <termios.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>

namespace Ovradr {

namespace {

volatile std::sig_atomic_t pendingSignal = 0;

void noteSignal(int number) {
    pendingSignal = number;
}

/// Switches the echo of the terminal off. A signal that would end the program waits until the echo
/// is back; it ends the wait for input.
class NoEcho {
public:
    NoEcho() {
        pendingSignal = 0;
        struct sigaction note {};
        note.sa_handler = noteSignal;
        sigemptyset(&note.sa_mask);
        sigset_t blocked;
        sigemptyset(&blocked);
        for (std::size_t i = 0; i < kSignals.size(); ++i) {
            sigaddset(&blocked, kSignals.at(i));
            sigaction(kSignals.at(i), &note, &before_.at(i));
        }
        // Let through only while waiting, so that none falls between a look and the wait.
        pthread_sigmask(SIG_BLOCK, &blocked, &mask_);
        termios silent{};
        if (tcgetattr(STDIN_FILENO, &terminal_) == 0) {
            silent = terminal_;
            silent.c_lflag &= ~static_cast<tcflag_t>(ECHO);
            silent.c_lflag |= ICANON | ISIG | ECHONL;
            changed_ = tcsetattr(STDIN_FILENO, TCSAFLUSH, &silent) == 0;
        }
    }
    NoEcho(const NoEcho &) = delete;
    NoEcho &operator=(const NoEcho &) = delete;
    ~NoEcho() {
        if (changed_) {
            tcsetattr(STDIN_FILENO, TCSAFLUSH, &terminal_);
        }
        for (std::size_t i = 0; i < kSignals.size(); ++i) {
            sigaction(kSignals.at(i), &before_.at(i), nullptr);
        }
        pthread_sigmask(SIG_SETMASK, &mask_, nullptr);
        if (pendingSignal != 0) {
            std::fputc('\n', stderr);
            std::raise(pendingSignal);
        }
    }
    bool works() const { return changed_; }
    /// False if a signal came instead.
    bool waitForInput() const {
        pollfd input{STDIN_FILENO, POLLIN, 0};
        while (ppoll(&input, 1, nullptr, &mask_) < 0 && errno == EINTR) {
            if (pendingSignal != 0) {
                return false;
            }
        }
        return true;
    }

private:
    static constexpr std::array kSignals = {SIGINT, SIGTERM, SIGHUP, SIGQUIT};

    termios terminal_{};
    bool changed_ = false;
    sigset_t mask_{};
    std::array<struct sigaction, kSignals.size()> before_{};
};

Refusal unreadable(const std::string &where, const std::string &why) {
    return failure(ExitCode::kFailed, "No secret can be read from " + where + ": " + why + ".",
                   "Its first line has to be the password or, where one is asked for, the session "
                   "or the code.");
}

/// Reads up to the end of the line. One byte at a time: what follows the line is not ours.
Expected<Secret> readLine(int fd, const std::string &where) {
    Secret secret;
    char c = 0;
    for (;;) {
        const ssize_t count = read(fd, &c, 1);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            return unreadable(where, OvraBase::errnoText(errno));
        }
        if (count == 0 || c == '\n') {
            break;
        }
        if (!secret.append(c)) {
            return unreadable(where, "its first line has more than " +
                                         std::to_string(Secret::kMaxSize) + " bytes");
        }
    }
    c = 0;
    if (secret.get().ends_with('\r')) {
        secret.removeLast();
    }
    if (secret.empty()) {
        return unreadable(where, "its first line is empty");
    }
    if (!OvraBase::isUtf8(secret.get()) || secret.get().find('\0') != std::string::npos) {
        return unreadable(where, "its first line is not text in UTF-8");
    }
    return secret;
}

Expected<Secret> readPasswordFile(const std::string &path) {
    const OvraBase::UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY));
    struct stat status {};
    if (!fd || fstat(fd.get(), &status) != 0) {
        return unreadable(path, OvraBase::errnoText(errno));
    }
    if (S_ISREG(status.st_mode) && (status.st_mode & S_IROTH) != 0) {
        std::fprintf(stderr, "ovradr: everybody can read %s: chmod 600 it.\n",
                     printable(path).c_str());
    }
    return readLine(fd.get(), path);
}

} // namespace

bool isInteractive() {
    return isatty(STDIN_FILENO) == 1 && isatty(STDERR_FILENO) == 1;
}

Expected<Secret> askSecret(const std::string &question) {
    const NoEcho noEcho;
    if (!noEcho.works()) {
        return failure(ExitCode::kFailed, "The terminal cannot hide what is typed in.",
                       "Use --password-file or --password-stdin.");
    }
    std::fprintf(stderr, "%s: ", printable(question).c_str());
    std::fflush(stderr);
    if (!noEcho.waitForInput()) {
        return failure(ExitCode::kFailed, "The question was interrupted.", "");
    }
    // A terminal delivers a line only once it is complete.
    return readLine(STDIN_FILENO, "the terminal");
}

Expected<Secret> askLine(const std::string &question) {
    std::fprintf(stderr, "%s: ", printable(question).c_str());
    std::fflush(stderr);
    return readLine(STDIN_FILENO, "the terminal");
}

Expected<Secret> obtainPassword(const PasswordSource &source, const std::string &question,
                                bool twice) {
    if (source.fromStdin) {
        return readLine(STDIN_FILENO, "standard input");
    }
    if (!source.file.empty()) {
        return readPasswordFile(source.file);
    }
    if (!isInteractive()) {
        return failure(ExitCode::kUsage,
                       "There is no terminal on which the password could be asked for.",
                       "Use --password-file or --password-stdin.");
    }
    Expected<Secret> password = askSecret(question);
    if (!password || !twice) {
        return password;
    }
    const Expected<Secret> again = askSecret("Again");
    if (!again) {
        return Refusal(again.error());
    }
    if (password->get() != again->get()) {
        return failure(ExitCode::kFailed, "The two passwords differ.", "Try again.");
    }
    return password;
}

bool confirm(const std::string &question) {
    std::fprintf(stderr, "%s [y/N] ", printable(question).c_str());
    std::fflush(stderr);
    // More than is looked at: the rest of the line must not answer the next question.
    std::array<char, 256> line{};
    const ssize_t size = read(STDIN_FILENO, line.data(), line.size());
    std::string answer(line.data(), size > 0 ? static_cast<std::size_t>(size) : 0);
    answer.erase(answer.find_last_not_of(" \t\r\n") + 1);
    return answer == "y" || answer == "Y" || answer == "yes" || answer == "Yes";
}

} // namespace Ovradr
