// SPDX-License-Identifier: Apache-2.0
#define OVRA_LOG_FILE "dr_node"

// The identity of the local node.

#include "ovradrnode/dr_node.h"
#include "paths.h"
#include "words.h"

#include <ovrabase/file.h>
#include <ovracore/ovracore.h>
#include <ovradrcore/file_lock.h>
#include <ovradrcore/log.h>
#include <ovradrcore/util.h>

#include <sys/file.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <memory>
#include <optional>

namespace OvraDRNode {

using OvraDRCore::FileLock;

namespace {

constexpr int kReadLock = LOCK_SH | LOCK_NB;
constexpr int kWriteLock = LOCK_EX | LOCK_NB;
constexpr unsigned int kLockWait = 5;
constexpr mode_t kConfigDirMode = 0755;
constexpr int kUuidAttempts = 7;
constexpr int kTextSize = 1024;
constexpr int kNodeIdSize = 128;

/// What the identity file holds; std::nullopt if it cannot be read.
std::optional<std::string> storedNodeId() {
    std::array<char, kNodeIdSize> buffer{};
    if (OLIBCFileGetKeyValue(Path::kIdentityFile, Word::kNodeId, buffer.data(), kNodeIdSize, 0) <
        0) {
        return std::nullopt;
    }
    buffer.back() = '\0';
    return buffer.data();
}

/// The stored id, or "" if there is none; std::nullopt if the lock could not be had, or the file
/// not be read, so that nobody knows.
std::optional<std::string> ReadNodeIdFromConf() {
    FileLock lock(Path::kIdentityLock);
    if (OLIBCFileExist(Path::kIdentityFile) == 0) {
        return "";
    }
    if (!lock.lock(kReadLock, kLockWait)) {
        OVRA_ERR("Failed to lock [%s]", Path::kIdentityLock);
        return std::nullopt;
    }
    std::optional<std::string> id = storedNodeId();
    if (!id) {
        OVRA_ERR("Failed to get nodeId");
    } else if (id->empty()) {
        OVRA_WARN("Invalid nodeId [%s]", id->c_str());
    }
    return id;
}

std::string generateNodeId() {
    for (int attempt = 0; attempt < kUuidAttempts; ++attempt) {
        std::string id = OvraDRCore::GenerateUUID();
        if (!id.empty()) {
            return id;
        }
    }
    return {};
}

/// Does not read again what was read: of two processes that both found no id, the later one wins.
/// \param unread  the file could not be locked or read just now: an id that it holds is kept
std::string CreateNodeId(bool unread) {
    FileLock lock(Path::kIdentityLock);
    std::string id = generateNodeId();
    if (id.empty()) {
        OVRA_ERR("Failed to create nodeId");
        return {};
    }
    if (!OvraDRCore::File::CreateDir(Path::kConfigDir, kConfigDirMode)) {
        OVRA_ERR("Failed to create dir [%s]", Path::kConfigDir);
        return {};
    }
    if (!lock.lock(kWriteLock, kLockWait)) {
        OVRA_ERR("Failed to lock [%s]", Path::kIdentityLock);
        return {};
    }
    if (unread) {
        if (std::optional<std::string> stored = storedNodeId(); stored && !stored->empty()) {
            return *stored;
        }
    }
    if (OLIBCFileSetKeyValue(Path::kIdentityFile, Word::kNodeId, id.c_str(), "%s=\"%s\"\n") < 0) {
        OVRA_ERR("Failed to set node_id");
        return {};
    }
    return id;
}

} // namespace

std::string DRNode::getLocalHostName() {
    std::array<char, kTextSize> buffer{};
    if (OVRALnxGetHostname(buffer.data(), kTextSize) < 0) {
        OVRA_ERR("Failed to get hostname.");
    }
    buffer.back() = '\0';
    return buffer.data();
}

std::string DRNode::getLocalSerial() {
    std::array<char, kTextSize> buffer{};
    if (OLIBGetSerialNumber(buffer.data(), kTextSize) < 0) {
        OVRA_ERR("Failed to get serial number.");
    }
    buffer.back() = '\0';
    return buffer.data();
}

std::string DRNode::getLocalNodeId() {
    const std::optional<std::string> stored = ReadNodeIdFromConf();
    if (stored && !stored->empty()) {
        return *stored;
    }
    std::string id = CreateNodeId(!stored);
    if (id.empty()) {
        OVRA_ERR("Failed to create nodeId");
    }
    return id;
}

bool DRNode::resetLocalNodeId() {
    if (OLIBCFileExist(Path::kIdentityFile) == 0) {
        return true;
    }
    FileLock lock(Path::kIdentityLock);
    const bool locked = lock.lock(kWriteLock, kLockWait);
    if (locked) {
        // Else a power failure might bring the old id back.
        if (unlink(Path::kIdentityFile) == 0) {
            (void)OvraBase::syncFolderOf(Path::kIdentityFile);
        }
    } else {
        OVRA_ERR("Failed to lock [%s]", Path::kIdentityLock);
    }
    lock.unlock();
    OVRA_WARN("Reset local nodeId: [%s]", locked ? "success" : "faled");
    return locked;
}

DRNode DRNode::getLocalNode() {
    const std::string id = getLocalNodeId();
    return {id, id};
}

std::vector<Conn> DRNode::getLocalConn() {
    return Conn::listLocal();
}

bool DRNode::isLocalNodeId(const std::string &id) {
    if (id.empty()) {
        return false;
    }
    // Not a static of its own: a child forked during its initialisation would wait for it for ever.
    static std::atomic<const std::string *> known{nullptr};
    const std::string *localId = known.load();
    if (localId == nullptr) {
        auto first = std::make_unique<const std::string>(getLocalNodeId());
        if (known.compare_exchange_strong(localId, first.get())) {
            localId = first.release(); // as long as the process
        }
    }
    return id == *localId;
}

} // namespace OvraDRNode
