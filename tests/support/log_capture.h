// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>
#include <vector>

/// Captures this process's log lines during its lifetime, instead of the system log.
class LogCapture {
public:
    LogCapture();
    ~LogCapture();
    LogCapture(const LogCapture &) = delete;
    LogCapture &operator=(const LogCapture &) = delete;

    /// Each as "PRIORITY line".
    std::vector<std::string> lines() const;
    /// How many lines contain `text`.
    int count(const std::string &text) const;
    /// How many lines have `level` ("ERR", ...), unit `file`, `function` and exactly `message`.
    int count(const std::string &level, const std::string &file, const std::string &function,
              const std::string &message) const;
    void clear();
};
