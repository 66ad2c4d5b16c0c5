// SPDX-License-Identifier: Apache-2.0
#include "service/connections.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <list>
#include <string>
#include <thread>
#include <utility>
#include <vector>

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

TEST(Connections, MakeRoomByEndingTheOneThatWaitedLongestOfAllOrOfAClientWithTooMany) {
    const struct {
        ConnectionLimits limits;
        std::vector<std::pair<const char *, Phase>> open;
        const char *next;
        int ended; ///< of those; -1: none, the next one is refused
    } scenes[] = {{{.total = 3},
                   {{"a", Phase::kWorking}, {"b", Phase::kArriving}, {"c", Phase::kIdle}},
                   "d",
                   1},
                  {{.total = 10, .perClient = 2},
                   {{"b", Phase::kArriving}, {"a", Phase::kArriving}, {"a", Phase::kArriving}},
                   "a",
                   1},
                  {{.total = 2}, {{"a", Phase::kWorking}, {"a", Phase::kReplying}}, "b", -1}};
    for (const auto &scene : scenes) {
        Connections table(scene.limits);
        std::list<Client> clients;
        for (const auto &[name, phase] : scene.open) {
            clients.emplace_back(table, name).enter(phase);
            std::this_thread::sleep_for(2ms);
        }
        EXPECT_EQ(table.admit(scene.next), scene.ended >= 0);
        int number = 0;
        for (const Client &client : clients) {
            EXPECT_EQ(client.isShut(), number++ == scene.ended) << scene.next << number;
        }
    }
}

TEST(Connections, CountsOneThatIsClosedNoMore) {
    Connections table({.total = 1});
    Client(table, "a").enter(Phase::kWorking);
    EXPECT_TRUE(table.admit("a"));
}

TEST(Connections, EndWhenTheTimeOfTheirPhaseIsOver) {
    Connections table({.arriving = 100ms, .idle = 100ms, .replying = 100ms});
    for (const Phase phase : {Phase::kArriving, Phase::kIdle, Phase::kReplying, Phase::kWorking}) {
        Client client(table, "a");
        client.enter(phase);
        EXPECT_EQ(client.isShut(1000ms), phase != Phase::kWorking) << static_cast<int>(phase);
    }
}

TEST(Connections, DoNotGiveANewConnectionMoreTimeBecauseItsHeaderCame) {
    Connections table({.arriving = 600ms});
    Client client(table, "a");
    std::this_thread::sleep_for(400ms);
    client.beginRequest();
    const Client later(table, "b");
    EXPECT_TRUE(client.isShut(10s));
    EXPECT_FALSE(later.isShut());
}

} // namespace
