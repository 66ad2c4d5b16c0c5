// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "faults/faults.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <string>
#include <system_error>
#include <utility>

namespace OvraTest {

/// A program that is to meet a fault: the control that it and the test share.
class Victim {
public:
    /// \param library  that of faults.cpp
    Victim(const std::string &name, std::string library)
        : path_("/tmp/faults-" + name)
        , library_(std::move(library)) {
        const int fd = open(path_.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
        void *const shared =
            ftruncate(fd, sizeof(FaultControl)) == 0
                ? mmap(nullptr, sizeof(FaultControl), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0)
                : MAP_FAILED;
        if (shared == MAP_FAILED) {
            throw std::system_error(errno, std::generic_category(), path_);
        }
        close(fd);
        control_ = static_cast<FaultControl *>(shared);
    }
    Victim(const Victim &) = delete;
    Victim &operator=(const Victim &) = delete;
    ~Victim() { munmap(control_, sizeof(FaultControl)); }

    /// From now on the `at`-th call meets the fault, in every process that entered.
    void arm(Fault fault, int at, int error = 0) const {
        control_->plan = {fault, error, {}};
        control_->left = at;
        control_->met = false;
        control_->armed = true;
    }
    void disarm() const { control_->armed = false; }
    bool met() const { return control_->met; }
    /// How many calls are left until the fault.
    int left() const { return control_->left; }
    /// For the process that is to become the program.
    void enter() const {
        setenv(kControlVariable, path_.c_str(), 1);
        setenv("LD_PRELOAD", library_.c_str(), 1);
    }

private:
    std::string path_;
    std::string library_;
    FaultControl *control_;
};

} // namespace OvraTest
