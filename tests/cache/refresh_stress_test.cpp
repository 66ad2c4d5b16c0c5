// SPDX-License-Identifier: Apache-2.0
// Many processes refresh all shared entries, over live, slow and dead endpoints, while some of them
// are killed, or stopped and continued. There must be no deadlock: whoever waits longer than kBound
// was in one.
#include "clock.h"
#include "support/local_node.h"
#include "support/log_capture.h"
#include "support/misbehaving_server.h"
#include "support/remote_node.h"

#include <ovradrnode/cred_permission_cache.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/node_cache.h>
#include <ovradrnode/sender.h>

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <chrono>
#include <csignal>
#include <functional>
#include <random>
#include <thread>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

constexpr int kWorkers = 16;
/// The first of them are killed and stopped; two others in a deadlock would stay in it for long.
constexpr int kMortals = 4;
constexpr unsigned kBound = 10; // seconds for one operation
constexpr std::int64_t kDefaultDuration = 8'000;
constexpr int kClockRate = 50; // the lifetimes of 3 to 60 seconds pass in 60 to 1,200 milliseconds
constexpr std::array kNodes = {"n1", "n2", "n3"};

/// Milliseconds.
std::int64_t uptime() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(
               std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

/// An operation that refreshes, on one of the nodes.
const std::array<std::function<void(const std::string &node, const Conn &conn)>, 7> kOperations = {
    [](const std::string &node, const Conn &) { NodeCache(node, true).Read(); },
    [](const std::string &node, const Conn &) { NodeCache(node, false).Update(); },
    [](const std::string &node, const Conn &) { NodeSender(node).getCachedCredId(); },
    [](const std::string &node, const Conn &) {
        CredPermissionCache("live-" + node).HasPrivilege();
    },
    [](const std::string &node, const Conn &) {
        (void)CredNodeSender("slow-" + node).testPrivilege(); // either way it refreshes
    },
    [](const std::string &, const Conn &conn) { BaseSender::GetCachedConnectable(conn); },
    [](const std::string &node, const Conn &) {
        (void)NodeSender(node).process(WebAPI::getDRNodeInfoAPI({})); // either way it refreshes
    },
};

/// Shared between the processes.
struct Board {
    std::atomic<bool> stop{false};
    std::array<std::atomic<int>, kOperations.size()> done{};
    std::atomic<int> hindered{0};
    std::atomic<int> blocked{0};
};

[[noreturn]] void work(Board &board, unsigned seed, const std::vector<Conn> &conns) {
    std::mt19937 random(seed);
    LogCapture log;
    while (!board.stop) {
        const std::size_t operation = random() % kOperations.size();
        alarm(kBound); // ends this process
        kOperations[operation](kNodes[random() % kNodes.size()], conns[random() % conns.size()]);
        alarm(0);
        ++board.done[operation];
        board.hindered += log.count("Waited too long");
        log.clear();
    }
    _exit(0);
}

/// Keeps the workers running, and every 20 ms kills, stops or continues one of the mortal ones;
/// then waits for them all.
void playStorm(Board &board, std::int64_t duration, const std::vector<Conn> &conns) {
    std::mt19937 random(1);
    std::array<pid_t, kWorkers> workers{};
    const auto start = [&](pid_t &worker) {
        const auto seed = static_cast<unsigned>(random());
        worker = fork();
        if (worker == 0) {
            work(board, seed, conns);
        }
    };
    const auto reap = [&](pid_t worker) {
        int status = 0;
        waitpid(worker, &status, 0);
        board.blocked += WIFSIGNALED(status) && WTERMSIG(status) == SIGALRM ? 1 : 0;
    };
    std::for_each(workers.begin(), workers.end(), start);
    for (const std::int64_t end = uptime() + duration; uptime() < end;) {
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        pid_t &worker = workers[random() % kMortals];
        constexpr std::array kSignals = {SIGSTOP, SIGCONT, SIGKILL};
        const int signal = kSignals[random() % kSignals.size()];
        kill(worker, signal);
        if (signal == SIGKILL) {
            reap(worker);
            start(worker);
        }
    }
    board.stop = true;
    for (const pid_t worker : workers) {
        kill(worker, SIGCONT);
        reap(worker);
    }
}

} // namespace

TEST(RefreshStress, NoTwoProcessesWaitForEachOther) {
    const char *const seconds = std::getenv("OVRADR_STRESS_SECONDS");
    const std::int64_t duration =
        seconds != nullptr ? std::strtol(seconds, nullptr, 10) * 1000 : kDefaultDuration;
    auto *const memory =
        mmap(nullptr, sizeof(Board), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    ASSERT_NE(memory, MAP_FAILED);
    Board &board = *new (memory) Board;
    int gate[2];
    ASSERT_EQ(pipe(gate), 0);
    OvraDRCore::setSystemClock([] { return uptime() * kClockRate; });
    provisionNode();
    DRNode::getLocalNodeId();

    // Forked before the servers' threads exist; starts once it receives their ports.
    std::array<int, 3> ports{};
    const pid_t storm = fork();
    if (storm == 0) {
        if (read(gate[0], ports.data(), sizeof ports) == sizeof ports) {
            std::vector<Conn> conns;
            for (const int port : ports) {
                conns.push_back(Conn::https("127.0.0.1", port));
            }
            playStorm(board, duration, conns);
        }
        _exit(0);
    }
    RemoteNode live;
    RemoteNode slow;
    live.trust();
    slow.trust();
    for (const char *method : {"probe", "info", "test_privilege"}) {
        slow.before(method, [] { std::this_thread::sleep_for(std::chrono::milliseconds(100)); });
    }
    slow.answer("test_privilege", R"({"success":false,"error":{"code":105}})");
    live.answer("info", R"({"success":true,"data":{"hostname":"far"}})");
    ports = {live.port(), slow.port(), unusedPort()};
    for (const std::string node : kNodes) {
        addCred("node_cred", node, "dead-" + node, "https", ports[2], "s");
        addCred("node_cred", node, "slow-" + node, "https", ports[1], "s");
        addCred("node_cred", node, "live-" + node, "https", ports[0], "s");
    }
    ASSERT_EQ(write(gate[1], ports.data(), sizeof ports), static_cast<ssize_t>(sizeof ports));
    waitpid(storm, nullptr, 0);

    EXPECT_EQ(board.blocked, 0);
    EXPECT_EQ(board.hindered, 0);
    for (std::size_t i = 0; i < kOperations.size(); ++i) {
        EXPECT_GT(board.done[i], 0) << "operation " << i;
    }
    EXPECT_TRUE(NodeSender("n1").process(WebAPI::getDRNodeInfoAPI({})).isSuccess());
    EXPECT_EQ(NodeCache("n1", true).GetHostName(), "far");
    OvraDRCore::setSystemClock(nullptr);
    munmap(memory, sizeof(Board));
}
