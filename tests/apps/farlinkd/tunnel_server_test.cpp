// SPDX-License-Identifier: Apache-2.0
#include "support/sockets.h"
#include "tunnel_server.h"

#include <condition_variable>
#include <list>
#include <mutex>
#include <thread>

namespace {

using Farlinkd::TunnelServer;
using OvraBase::UniqueFd;
using OvraService::Listener;
using namespace OvraTest;

constexpr std::chrono::seconds kLong{120};

class ThroughTheTunnelServer : public testing::Test {
protected:
    void begin(const TunnelServer::Limits &limits) {
        server = std::make_unique<TunnelServer>(
            [this](const std::string &alias, const std::string &id, const std::string &client) {
                const std::lock_guard lock(mutex);
                if (client == "127.0.0.1") {
                    rung = alias == "nas" ? id : "";
                    announced.notify_all();
                }
                return there;
            },
            limits);
        auto tunnel = Listener::listen("127.0.0.1", 0);
        auto callers = Listener::listen("127.0.0.1", 0);
        ASSERT_TRUE(tunnel && callers);
        tunnelPort = tunnel->port;
        callerPort = callers->port;
        ASSERT_TRUE(server->start(std::move(*tunnel)));
        server->open("nas", std::move(*callers));
    }
    /// The caller announced since the last call.
    std::string caller() {
        std::unique_lock lock(mutex);
        announced.wait_for(lock, std::chrono::seconds(10), [this] { return !rung.empty(); });
        return std::exchange(rung, "");
    }
    UniqueFd answer(const std::string &id) const {
        UniqueFd fd = dial(tunnelPort);
        say(fd, "FARLINK1 " + id + "\n");
        return fd;
    }

    std::mutex mutex;
    std::condition_variable announced;
    std::string rung;
    bool there = true;
    int tunnelPort = 0;
    int callerPort = 0;
    std::unique_ptr<TunnelServer> server;
};

} // namespace

TEST_F(ThroughTheTunnelServer, EveryByteGoesThroughBothWaysAlsoAfterOneEndHasFinished) {
    begin({});
    std::string much(8 << 20, '\0');
    for (std::size_t i = 0; i < much.size(); ++i) {
        much[i] = static_cast<char>(i * 2654435761U >> 24U);
    }
    UniqueFd client = dial(callerPort);
    say(client, "early"); // before the appliance connects
    UniqueFd appliance = answer(caller());
    std::thread talk([&] {
        say(client, much);
        shutdown(client.get(), SHUT_WR);
    });
    const std::string heard = hearAll(appliance);
    talk.join();
    EXPECT_TRUE(heard == "early" + much);
    std::thread reply([&] {
        say(appliance, much);
        appliance.reset();
    });
    EXPECT_TRUE(hearAll(client) == much);
    reply.join();
}

TEST_F(ThroughTheTunnelServer, NobodyIsConnectedToSomebodyElse) {
    begin({.line = std::chrono::milliseconds(300), .answer = std::chrono::milliseconds(600)});
    const UniqueFd client = dial(callerPort);
    const std::string id = caller();
    std::string other = id;
    other[0] = other[0] == '0' ? '1' : '0';
    EXPECT_EQ(hearAll(answer(other)), "") << "another caller";
    EXPECT_EQ(hearAll(answer(id.substr(1))), "") << "never says it all";
    EXPECT_EQ(hearAll(client), "") << "whom nobody answers";
    EXPECT_EQ(hearAll(answer(id)), "") << "too late";
    there = false;
    EXPECT_EQ(hearAll(dial(callerPort)), "") << "the appliance is not there";
}

TEST_F(ThroughTheTunnelServer, AreBoundedAndEndWithTheAlias) {
    // Longer than anybody listens here: only the bounds end a connection.
    TunnelServer::Limits perAlias{.perAlias = 1, .arriving = 1, .line = kLong, .answer = kLong};
    TunnelServer::Limits all{.calls = 1, .arriving = 1, .line = kLong, .answer = kLong};
    for (const auto &limits : {perAlias, all}) {
        begin(limits);
        UniqueFd client = dial(callerPort);
        const std::string first = caller();
        EXPECT_EQ(hearAll(dial(callerPort)), "") << "one too many, while the first one waits";
        UniqueFd appliance = answer(first);
        say(appliance, "through");
        EXPECT_EQ(hear(client), "through");
        EXPECT_EQ(hearAll(dial(callerPort)), "") << "and once it is put through";
        const UniqueFd silent = dial(tunnelPort);
        const UniqueFd next = dial(tunnelPort);
        EXPECT_EQ(hearAll(silent), "") << "an appliance that says nothing makes room";
        server->close("nas");
        EXPECT_EQ(hearAll(client), "");
        EXPECT_EQ(hearAll(appliance), "");
    }
    begin({.idle = std::chrono::milliseconds(500)});
    const UniqueFd client = dial(callerPort);
    const UniqueFd appliance = answer(caller());
    EXPECT_EQ(hearAll(client), "") << "in silence for too long";
}

TEST_F(ThroughTheTunnelServer, OneClientNeverTakesAllPlacesFromTheOthers) {
    begin({.perAlias = 8, .arriving = 8, .line = kLong, .answer = kLong});
    std::list<UniqueFd> hostile;
    for (const char *attacker : {"127.0.0.2", "127.0.0.3", "127.0.0.4"}) {
        for (int i = 0; i < 8; ++i) {
            hostile.push_back(dial(callerPort, attacker));
            hostile.push_back(dial(tunnelPort, attacker));
        }
        const UniqueFd client = dial(callerPort);
        const UniqueFd appliance = answer(caller());
        say(appliance, "through");
        EXPECT_EQ(hear(client), "through");
    }
}

TEST_F(ThroughTheTunnelServer, OneThatMadeRoomAndHangsUpTakesNobodyWithIt) {
    begin({.perAlias = 8, .line = kLong, .answer = kLong});
    std::list<UniqueFd> hostile;
    for (const char client : std::string("22225551")) {
        hostile.push_back(dial(callerPort, (std::string("127.0.0.") + client).c_str()));
    }
    (void)caller(); // all have a place
    auto elsewhere = Listener::listen("127.0.0.1", 0);
    const int otherPort = elsewhere->port;
    server->open("other", std::move(*elsewhere));
    std::unique_lock held(mutex);
    const UniqueFd stop = dial(otherPort, "127.0.0.6"); // the server's thread waits in it
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    hostile.push_back(dial(callerPort, "127.0.0.3"));
    hostile.push_back(dial(callerPort, "127.0.0.4"));
    const UniqueFd client = dial(callerPort);
    for (UniqueFd &each : hostile) {
        shutdown(each.get(), SHUT_WR);
    }
    held.unlock();
    const UniqueFd appliance = answer(caller());
    say(appliance, "through");
    EXPECT_EQ(hear(client), "through");
}

TEST_F(ThroughTheTunnelServer, OneThatIsTurnedAwayTakesNobodysPlace) {
    begin({.perAlias = 8, .line = kLong, .answer = kLong});
    std::list<UniqueFd> waiting;
    for (const char client : std::string("22225551")) {
        waiting.push_back(dial(callerPort, (std::string("127.0.0.") + client).c_str()));
    }
    EXPECT_NE(caller(), "") << "all have a place";
    there = false;
    EXPECT_EQ(hearAll(dial(callerPort, "127.0.0.3")), "") << "the appliance is not there";
    char byte = 0;
    for (const UniqueFd &each : waiting) {
        EXPECT_EQ(recv(each.get(), &byte, 1, MSG_DONTWAIT), -1);
    }
}

TEST_F(ThroughTheTunnelServer, WhatTheOtherEndDoesNotTakeStaysWithTheSender) {
    begin({});
    const UniqueFd client = dial(callerPort);
    UniqueFd appliance = answer(caller());
    const timeval patience{1, 0};
    setsockopt(client.get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
    const std::string chunk(1 << 20, 'x');
    std::size_t taken = 0;
    for (ssize_t size = 1; size > 0 && taken < (128U << 20U);) {
        size = send(client.get(), chunk.data(), chunk.size(), MSG_NOSIGNAL);
        taken += size > 0 ? static_cast<std::size_t>(size) : 0;
    }
    EXPECT_LT(taken, 64U << 20U) << "the kernel's buffers, of four sockets";
    shutdown(client.get(), SHUT_WR);
    EXPECT_EQ(hearAll(appliance).size(), taken);
}
