// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "support/other_process.h"

#include <fcntl.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

namespace OvraTest {

struct OutputPipe {
    OutputPipe() {
        if (pipe2(ends, O_CLOEXEC) != 0) {
            std::abort();
        }
    }
    int ends[2];
};

/// A daemon's real program.
class DaemonProgram : OutputPipe, public OtherProcess {
public:
    /// \param prepare  runs in the process before the program
    explicit DaemonProgram(
        std::vector<std::string> command, const std::function<void()> &prepare = [] {})
        : OtherProcess([&] {
            dup2(ends[1], STDOUT_FILENO);
            dup2(ends[1], STDERR_FILENO);
            prepare();
            // A daemon that exits with calls in progress abandons their threads, on purpose.
            const char *const options = getenv("TSAN_OPTIONS");
            const std::string own = options != nullptr ? options : "";
            setenv("TSAN_OPTIONS", (own + ":report_thread_leaks=0").c_str(), 1);
            std::vector<char *> argv;
            for (std::string &argument : command) {
                argv.push_back(argument.data());
            }
            argv.push_back(nullptr);
            return execv(argv[0], argv.data());
        }) {
        close(ends[1]);
    }
    ~DaemonProgram() { fclose(output_); }

    /// The next line of its output that is not of its log; "" at the end.
    std::string line() {
        char text[512] = "";
        while (fgets(text, sizeof(text), output_) != nullptr) {
            if (strstr(text, ")[") == nullptr) {
                return text;
            }
        }
        return "";
    }

private:
    FILE *output_ = fdopen(ends[0], "r");
};

} // namespace OvraTest
