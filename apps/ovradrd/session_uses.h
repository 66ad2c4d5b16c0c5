// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "shared/overview.h"

#include <map>
#include <mutex>
#include <string>
#include <unordered_map>

namespace Ovradrd {

/// When each session was last used, since this process began: a note in a file at every call would
/// cost more than the call. Thread-safe.
class SessionUses {
public:
    void note(const std::string &sid, const std::string &client);
    /// By the references of the sessions.
    std::map<std::string, OvraApps::SessionUse> list() const;

private:
    mutable std::mutex mutex_;
    std::unordered_map<std::string, OvraApps::SessionUse> uses_; ///< by reference
};

} // namespace Ovradrd
