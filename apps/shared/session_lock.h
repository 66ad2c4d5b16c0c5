// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrcore/file_lock.h>

namespace OvraApps {

/// Keeps two kinds of flows of this appliance apart: another node hands out the previous session as
/// long as it has it, and until the row that uses it is stored nothing may release it.
///
/// Held only during the flow itself, never during a prompt. A flow that does not get it within 30
/// seconds goes on without it, because a stuck process must not block the others.
class SessionLock {
public:
    enum class Purpose {
        kObtain, ///< a flow that stores a session; many at a time
        kRelease ///< a flow that may release one; alone
    };

    explicit SessionLock(Purpose purpose);

private:
    OvraDRCore::FileLock lock_;
};

} // namespace OvraApps
