// SPDX-License-Identifier: Apache-2.0
#include "service/connections.h"
#include "service/listener.h"
#include "support/sockets.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>

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

/// A client's connection over the loopback interface.
class Client {
public:
    Client(Connections &table, const std::string &name)
        : table_(table) {
        const auto listener = OvraService::Listener::listen("127.0.0.1", 0);
        ours_ = OvraTest::dial(listener->port);
        theirs_.reset(accept4(listener->socket.get(), nullptr, nullptr, SOCK_CLOEXEC));
        connection_ = table.open(theirs_.get(), name);
    }
    Client(const Client &) = delete;
    ~Client() { table_.close(connection_); }

    void enter(Phase phase) { table_.enter(connection_, phase); }
    void beginRequest() { table_.beginRequest(connection_); }
    void sendBody(std::size_t bytes) { table_.progress(connection_, bytes); }
    void takeReply(const std::string &text) {
        OvraTest::say(theirs_, text);
        (void)OvraTest::hear(ours_);
    }
    void say(const std::string &text) { OvraTest::say(ours_, text); }
    /// Whether the connection is shut down within the time.
    bool isShut(std::chrono::milliseconds wait = 0ms) const {
        pollfd end{ours_.get(), POLLIN, 0};
        return poll(&end, 1, static_cast<int>(wait.count())) == 1;
    }

private:
    Connections &table_;
    OvraBase::UniqueFd ours_;
    OvraBase::UniqueFd theirs_;
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

TEST(Connections, EndSoonAfterTheFirstByteOfAFurtherRequest) {
    Connections table({.arriving = 300ms, .idle = 60s});
    Client silent(table, "a");
    Client slow(table, "a");
    Client early(table, "a"); // before the reply to its first request
    for (Client *each : {&silent, &slow, &early}) {
        each->enter(Phase::kWorking);
    }
    early.say("P");
    std::this_thread::sleep_for(50ms);
    for (Client *each : {&silent, &slow, &early}) {
        each->enter(Phase::kIdle);
    }
    slow.say("P");
    EXPECT_TRUE(slow.isShut(10s));
    EXPECT_TRUE(early.isShut(10s));
    EXPECT_FALSE(silent.isShut());
}

TEST(Connections, LastAsLongAsBodyOrReplyTravelFastEnough) {
    Connections table({.arriving = 1500ms, .replying = 1500ms, .leastRate = 100});
    for (const Phase phase : {Phase::kArriving, Phase::kReplying, Phase::kSending}) {
        const auto run = [&](std::size_t bytes) {
            Client client(table, "a");
            client.enter(phase);
            for (int i = 0; i < 25 && !client.isShut(); ++i) {
                phase == Phase::kArriving ? client.sendBody(bytes)
                                          : client.takeReply(std::string(bytes, 'x'));
                std::this_thread::sleep_for(100ms);
            }
            return client.isShut();
        };
        EXPECT_FALSE(run(90)) << static_cast<int>(phase);
        EXPECT_TRUE(run(1)) << static_cast<int>(phase);
    }
}

} // namespace
