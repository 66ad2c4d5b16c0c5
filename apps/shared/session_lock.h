// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrcore/file_lock.h>

#include <string>

namespace OvraApps {

/// Keeps two kinds of flows of this appliance apart that concern the same other node: it hands out
/// the previous session as long as it has it, and until the row that uses it is stored nothing may
/// release it; and of two flows that change one row, the second has to see what the first one left.
///
/// One lock file a node. Held only during the flow itself, never during a prompt, and by a flow
/// whose requests the other node answers without one of its own, so that no two appliances wait for
/// each other.
class SessionLock {
public:
    enum class Purpose {
        kObtain, ///< a flow that only adds a row with a session; many at a time
        kRelease ///< a flow that changes or removes a row, or may release a session; alone
    };
    /// In seconds; several times as long as a flow with a node that does not answer.
    static constexpr unsigned int kPatience = 60;

    /// \param patience  how long to wait for it, in seconds
    SessionLock(const std::string &nodeId, Purpose purpose, unsigned int patience = kPatience);

    /// Whether another flow still has it: nothing may be changed. False if the lock file cannot be
    /// used at all, which is logged; a flow then goes on without it.
    bool isBusy() const { return busy_; }

private:
    OvraDRCore::FileLock lock_;
    bool busy_ = false;
};

} // namespace OvraApps
