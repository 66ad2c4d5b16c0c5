// SPDX-License-Identifier: Apache-2.0
#include "shared/session_lock.h"

#include <ovradrcore/log.h>

#include <sys/file.h>

namespace OvraApps {

namespace {

constexpr const char *kLockFile = "drnode.sessions.lock";
constexpr unsigned int kPatience = 30; // seconds

} // namespace

SessionLock::SessionLock(Purpose purpose)
    : lock_(kLockFile) {
    if (!lock_.lock(purpose == Purpose::kObtain ? LOCK_SH : LOCK_EX, kPatience)) {
        OVRA_WARN("Another process holds [%s] for long: going on without it", kLockFile);
    }
}

} // namespace OvraApps
