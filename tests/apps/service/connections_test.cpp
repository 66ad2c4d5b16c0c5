// SPDX-License-Identifier: Apache-2.0
#include "service/connections.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>

namespace {

using OvraService::ConnectionLimits;
using OvraService::Connections;
using Phase = Connections::Phase;
using namespace std::chrono_literals;

/// One end of a socket pair represents a client's connection.
class Client {
public:
    Client(Connections &table, const std::string &name)
        : table_(table) {
        if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends_) == 0) {
            connection_ = table.open(ends_[0], name);
        }
    }
    Client(const Client &) = delete;
    ~Client() {
        table_.close(connection_);
        close(ends_[0]);
        close(ends_[1]);
    }

    void enter(Phase phase) { table_.enter(connection_, phase); }
    void beginRequest() { table_.beginRequest(connection_); }
    /// Whether the connection is shut down within the time.
    bool isShut(std::chrono::milliseconds wait = 0ms) const {
        pollfd end{ends_[1], POLLIN, 0};
        return poll(&end, 1, static_cast<int>(wait.count())) == 1;
    }

private:
    Connections &table_;
    int ends_[2] = {-1, -1};
    Connections::Connection *connection_ = nullptr;
};

TEST(Connections, MakesRoomByEndingTheOneThatWaitedLongestForItsClient) {
    Connections table({.total = 3});
    Client working(table, "a");
    working.enter(Phase::kWorking);
    Client slow(table, "b");
    std::this_thread::sleep_for(2ms);
    Client idle(table, "c");
    idle.enter(Phase::kIdle);

    EXPECT_TRUE(table.admit("d"));
    EXPECT_TRUE(slow.isShut());
    EXPECT_FALSE(idle.isShut());
    EXPECT_FALSE(working.isShut());
}

TEST(Connections, KeepsOneClientFromTakingTheRoomOfOthers) {
    Connections table({.total = 10, .perClient = 2});
    Client other(table, "b");
    std::this_thread::sleep_for(2ms);
    Client first(table, "a");
    std::this_thread::sleep_for(2ms);
    Client second(table, "a");
    EXPECT_TRUE(table.admit("a"));
    EXPECT_TRUE(first.isShut());
    EXPECT_FALSE(second.isShut());
    EXPECT_FALSE(other.isShut());
}

TEST(Connections, RefusesWhenEveryConnectionIsBeingServed) {
    Connections table({.total = 2});
    Client working(table, "a");
    working.enter(Phase::kWorking);
    Client replying(table, "a");
    replying.enter(Phase::kReplying);
    EXPECT_FALSE(table.admit("b"));
    EXPECT_FALSE(working.isShut());
    EXPECT_FALSE(replying.isShut());
}

TEST(Connections, CountsOneThatIsClosedNoMore) {
    Connections table({.total = 1});
    { const Client gone(table, "a"); }
    const Client present(table, "a");
    EXPECT_FALSE(present.isShut());
}

TEST(Connections, EndWhenTheTimeOfTheirPhaseIsOver) {
    ConnectionLimits limits;
    limits.arriving = limits.idle = limits.replying = 100ms;
    Connections table(limits);
    for (const Phase phase : {Phase::kArriving, Phase::kIdle, Phase::kReplying, Phase::kWorking}) {
        Client client(table, "a");
        client.enter(phase);
        EXPECT_EQ(client.isShut(1000ms), phase != Phase::kWorking) << static_cast<int>(phase);
    }
}

TEST(Connections, DoNotGiveANewConnectionMoreTimeBecauseItsHeaderCame) {
    ConnectionLimits limits;
    limits.arriving = 600ms;
    Connections table(limits);
    Client client(table, "a");
    std::this_thread::sleep_for(400ms);
    client.beginRequest();
    const Client later(table, "b");
    EXPECT_TRUE(client.isShut(10s));
    EXPECT_FALSE(later.isShut());
}

} // namespace
