// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "program.h"
#include "support/daemon_program.h"

#include <ovradrnode/conn.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/node_session.h>
#include <ovradrnode/sender.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>

namespace OvradrTest {

namespace fs = std::filesystem;

inline constexpr const char *kOwnFolders[] = {"/usr/ovra", "/run/lock", "/tmp/.ovradrcache"};

/// Everything that the appliance has made is gone.
inline void startAnew() {
    for (const char *folder : kOwnFolders) {
        std::error_code error; // a folder of the sandbox itself stays
        for (const auto &entry : fs::directory_iterator(folder, error)) {
            fs::remove_all(entry.path());
        }
    }
}

/// Uses every file that the library opens by itself.
inline int useLibrary() {
    using namespace OvraDRNode;
    std::vector<DRNode> nodes;
    DRNodeDB::List(nodes, DRNodeDB::CRED_TYPE_NODE | DRNodeDB::CRED_TYPE_TEMP);
    static_cast<void>(DRNode::getLocalNodeId());
    static_cast<void>(BaseSender::IsConnectable(Conn("127.0.0.1", "http", 1)));
    static_cast<void>(BaseSender::GetCachedConnectable(Conn("127.0.0.1", "http", 1)));
    static_cast<void>(NodeSession().CreateTempSession("admin", 60));
    return 0;
}

/// Starts the daemon, waits until it serves or refuses to, and has it end. \return its first line;
/// "" if it did not end by itself.
inline std::string useDaemon(const std::function<void()> &prepare = [] {}) {
    OvraTest::DaemonProgram daemon(std::vector<std::string>{OVRADRD_PROGRAM}, [&] {
        alarm(60);
        prepare();
    });
    const std::string said = daemon.line();
    kill(daemon.pid(), SIGTERM);
    return daemon.wait() >= 0 ? said : "";
}

/// The files of a version (tests/fixtures) and no others.
inline void unpack(const fs::path &archive) {
    startAnew();
    const std::string command = "tar -C / -xzf '" + archive.string() + "'";
    ASSERT_EQ(std::system(command.c_str()), 0) << command; // NOLINT: no other thread
}

inline fs::path newestArchive() {
    fs::path newest;
    for (const auto &entry : fs::directory_iterator(OVRA_FIXTURES)) {
        newest = entry.path().extension() == ".gz" ? std::max(newest, entry.path()) : newest;
    }
    return newest;
}

} // namespace OvradrTest
