// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <condition_variable>
#include <mutex>
#include <string>
#include <thread>

namespace Ovradr {

/// Shows what is going on and for how long, in one line on standard error that is erased at the
/// end. Silent if standard error is not a terminal.
///
/// It owns standard error while it lives: output of programs started meanwhile is captured, to be
/// reported in our own words.
class Progress {
public:
    Progress();
    Progress(const Progress &) = delete;
    Progress &operator=(const Progress &) = delete;
    ~Progress();

    /// Sets what is going on; the seconds restart.
    void say(const std::string &what);
    /// The last line that a program wrote, without its newline; "" if there was none.
    std::string caught() const;

private:
    void show();

    int screen_ = -1; ///< the original standard error; -1 if it could not be captured
    int caught_ = -1;
    bool terminal_ = false;
    std::mutex mutex_;
    std::condition_variable changed_;
    std::string what_;
    int seconds_ = 0;
    bool stop_ = false;
    std::thread thread_;
};

} // namespace Ovradr
