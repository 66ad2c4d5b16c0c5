// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>
#include <vector>

/// Takes what this process logs while it lives, instead of the system log.
class LogCapture {
public:
    LogCapture();
    ~LogCapture();
    LogCapture(const LogCapture &) = delete;
    LogCapture &operator=(const LogCapture &) = delete;

    /// Each as "PRIORITY line".
    std::vector<std::string> lines() const;
    /// How many lines hold `text`.
    int count(const std::string &text) const;
    /// How many lines are of `level` ("ERR", ...), from unit `file` and `function`, and say exactly
    /// `message`.
    int count(const std::string &level, const std::string &file, const std::string &function,
              const std::string &message) const;
    void clear();
};
