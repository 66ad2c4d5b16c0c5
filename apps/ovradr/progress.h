// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <condition_variable>
#include <mutex>
#include <string>
#include <thread>

namespace Ovradr {

/// Tells the person at the terminal what is going on and for how long already, in one line of
/// standard error that is gone at the end. Says nothing where standard error is no terminal.
///
/// Standard error belongs to it while it lives: what programs that are started meanwhile write
/// there is caught, to be said in our own words.
class Progress {
public:
    Progress();
    Progress(const Progress &) = delete;
    Progress &operator=(const Progress &) = delete;
    ~Progress();

    /// What is going on from now on; the seconds count anew.
    void say(const std::string &what);
    /// The last line that a program wrote, without an end of line; "" when none wrote anything.
    std::string caught() const;

private:
    void show();

    int screen_ = -1; ///< what standard error was before; -1 when it could not be taken
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
