// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <json/value.h>
#include <sys/types.h>

#include <string>
#include <vector>

namespace OvradrTest {

using Arguments = std::vector<std::string>;

/// Replaces this process by the program: that of this build, unless OVRADR_PROGRAM names another.
[[noreturn]] void execute(const Arguments &arguments);

/// The program's output and exit code; -1: ended by a signal, or killed after the time-out.
struct Result {
    int exit = -1;
    std::string out;
    std::string err;

    /// Standard output as one JSON document; null if it is anything else.
    Json::Value json() const;
};

/// The program, running with `input` as its standard input. Killed if still running on destruction.
class Program {
public:
    explicit Program(const Arguments &arguments, const std::string &input = "");
    Program(const Program &) = delete;
    Program &operator=(const Program &) = delete;
    ~Program();

    pid_t pid() const { return pid_; }
    /// Waits 30 seconds at most.
    Result finish();

private:
    pid_t pid_ = -1;
    int out_;
    int err_;
};

/// Runs the program to its end.
Result run(const Arguments &arguments, const std::string &input = "");

/// The program on its own terminal, with simulated input.
class Terminal {
public:
    explicit Terminal(const Arguments &arguments);
    Terminal(const Terminal &) = delete;
    Terminal &operator=(const Terminal &) = delete;
    ~Terminal();

    /// Reads until the screen shows `text` after the previously awaited text; false after 10
    /// seconds.
    bool shows(const std::string &text);
    void type(const std::string &text) const;
    bool echoes() const;
    /// Reads the rest. \return the exit code, or minus the signal
    int finish();
    const std::string &screen() const { return screen_; }

private:
    bool readOn();

    pid_t pid_ = -1;
    int master_ = -1;
    int slave_ = -1; ///< keeps the terminal, so that it can be looked at after the program's end
    std::string screen_;
    std::size_t seen_ = 0;
};

std::string readFile(const std::string &path);
void writeFile(const std::string &path, const std::string &content);

} // namespace OvradrTest
