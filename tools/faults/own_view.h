// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <sched.h>
#include <sys/mount.h>

#include <string>
#include <utility>
#include <vector>

namespace OvraTest {

/// From here on this process, which has one thread, and its children see a file system view of
/// their own, in which each second folder is the first one. \return false where that is not
/// permitted
[[nodiscard]] inline bool
enterView(const std::vector<std::pair<std::string, std::string>> &folders) {
    bool entered =
        unshare(CLONE_NEWNS) == 0 && mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0;
    for (const auto &[from, to] : folders) {
        entered = entered && mount(from.c_str(), to.c_str(), nullptr, MS_BIND, nullptr) == 0;
    }
    return entered;
}

} // namespace OvraTest
