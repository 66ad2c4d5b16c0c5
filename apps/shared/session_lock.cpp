// SPDX-License-Identifier: Apache-2.0
#include "shared/session_lock.h"

#include "shared/pending_releases.h"

#include <ovradrcore/log.h>

#include <sys/file.h>

#include <chrono>

namespace OvraApps {

namespace {

/// A hash, because the other node chose its id.
std::string lockName(const std::string &nodeId) {
    return "drnode.sessions." + referenceOf(nodeId) + ".lock";
}

} // namespace

SessionLock::SessionLock(const std::string &nodeId, Purpose purpose, unsigned int patience)
    : lock_(lockName(nodeId)) {
    const auto begun = std::chrono::steady_clock::now();
    if (lock_.lock(purpose == Purpose::kObtain ? LOCK_SH : LOCK_EX, patience)) {
        return;
    }
    busy_ = std::chrono::steady_clock::now() - begun >= std::chrono::seconds(patience);
    OVRA_WARN(busy_ ? "Another process changes credentials of node [%s] and keeps [%s] locked: "
                      "nothing is changed. Wait for it, or end it"
                    : "The flow with node [%s] goes on without its lock, because [%s] cannot be "
                      "used. Check /run/lock",
              nodeId.c_str(), lockName(nodeId).c_str());
}

} // namespace OvraApps
