// SPDX-License-Identifier: Apache-2.0
#define OVRA_LOG_FILE "dr_node"

// The identity of the local node.

#include "ovradrnode/dr_node.h"
#include "paths.h"
#include "words.h"

#include <ovracore/ovracore.h>
#include <ovradrcore/file_lock.h>
#include <ovradrcore/log.h>
#include <ovradrcore/util.h>

#include <sys/file.h>
#include <unistd.h>

#include <array>

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

std::string ReadNodeIdFromConf() {
    FileLock lock(Path::kIdentityLock);
    if (OLIBCFileExist(Path::kIdentityFile) == 0) {
        return {};
    }
    if (!lock.lock(kReadLock, kLockWait)) {
        OVRA_ERR("Failed to lock [%s]", Path::kIdentityLock);
        return {};
    }
    std::array<char, kNodeIdSize> buffer{};
    if (OLIBCFileGetKeyValue(Path::kIdentityFile, Word::kNodeId, buffer.data(), kNodeIdSize, 0) <
        0) {
        OVRA_ERR("Failed to get nodeId");
        return {};
    }
    buffer.back() = '\0';
    std::string id = buffer.data();
    if (id.empty()) {
        OVRA_WARN("Invalid nodeId [%s]", id.c_str());
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

/// Does not read the file again: of two processes that both found no id, the later one wins.
std::string CreateNodeId() {
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
    std::string id = ReadNodeIdFromConf();
    if (!id.empty()) {
        return id;
    }
    id = CreateNodeId();
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
        unlink(Path::kIdentityFile);
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
    static const std::string localId = getLocalNodeId();
    return id == localId;
}

} // namespace OvraDRNode
