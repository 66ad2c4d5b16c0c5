// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "platform/own_files.h"

#include <json/value.h>
#include <sys/types.h>

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace OvradrTest {

using OvraTest::modeOf;
using OvraTest::readFile;
using OvraTest::writeFile;
using Arguments = std::vector<std::string>;

/// All of them, one after the other.
Arguments operator+(Arguments first, const Arguments &second);

/// The program as a child process. Killed after a minute, or if still running on destruction.
class Process {
public:
    /// \param connect  gives the child its standard input and output
    Process(const Arguments &arguments, const std::function<void()> &connect);
    Process(const Process &) = delete;
    Process &operator=(const Process &) = delete;
    ~Process();

    pid_t pid() const { return pid_; }
    /// Repeats `meanwhile` until the end. \return the exit code, or minus the signal
    int wait(const std::function<void()> &meanwhile);

private:
    pid_t pid_;
};

struct Result {
    int exit; ///< the exit code, or minus the signal
    std::string out;
    std::string err;

    /// Standard output as one JSON document; null if it is anything else.
    Json::Value json() const;
};

/// The program, running with `input` as its standard input.
class Program {
public:
    /// \param prepare  what the child does before
    explicit Program(
        const Arguments &arguments, const std::string &input = "",
        const std::function<void()> &prepare = [] {});
    ~Program();

    pid_t pid() const { return process_.pid(); }
    Result finish();

private:
    std::vector<int> streams_;
    Process process_;
};

/// Runs the program to its end.
Result run(
    const Arguments &arguments, const std::string &input = "",
    const std::function<void()> &prepare = [] {});
/// As somebody without rights. The exit code is kNoOtherUser where there is nobody else.
Result runAsNobody(const Arguments &arguments);
inline constexpr int kNoOtherUser = 99;

/// The program on its own terminal, with simulated input.
class Terminal {
public:
    explicit Terminal(const Arguments &arguments);
    ~Terminal();

    /// Reads until the screen shows `text` after the previously awaited text; false if nothing new
    /// appears for 10 seconds.
    bool shows(const std::string &text);
    void type(const std::string &text) const;
    /// Types the line when the screen shows the question; false if it does not.
    bool answers(const std::string &question, const std::string &line);
    bool echoes() const;
    /// Reads the rest. \return the exit code, or minus the signal
    int finish();
    const std::string &screen() const { return screen_; }

private:
    bool readOn(int milliseconds);

    int master_ = -1;
    int slave_ = -1; ///< keeps the terminal, so that it can be looked at after the program's end
    std::optional<Process> process_;
    std::string screen_;
    std::size_t seen_ = 0;
};

} // namespace OvradrTest
