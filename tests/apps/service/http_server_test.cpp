// SPDX-License-Identifier: Apache-2.0
#include "service/http_server.h"
#include "support/sockets.h"

#include <atomic>
#include <utility>

namespace {

using namespace OvraService;

TEST(HttpServer, OfABodyThatGrowsLongWhileItStopsEndsTheConnection) {
    std::atomic<int> judged = 0; // never answered, as when the daemon's queues have stopped
    HttpServer server([](const auto &, const auto &answer) { answer("{}"); }, {.unjudged = 100}, {},
                      [&](const auto &, const auto &) { ++judged; });
    auto listener = Listener::listen("127.0.0.1", 0);
    const auto client = OvraTest::dial(listener->port);
    std::vector<Listener> sockets;
    sockets.push_back(std::move(*listener));
    ASSERT_TRUE(server.start({}, std::move(sockets), {}));
    const auto post = [&client](const std::string &body) {
        OvraTest::say(client, "POST /webapi/query.cgi HTTP/1.1\r\nHost: a\r\nContent-Type: "
                              "application/x-www-form-urlencoded\r\nContent-Length: " +
                                  std::to_string(body.size()) + "\r\n\r\n" + body);
    };
    post("a=1");
    while (OvraTest::hear(client).find("{}") == std::string::npos) {
    }
    server.quiesce();
    post(std::string(200, 'x'));
    EXPECT_EQ(OvraTest::hearAll(client), "");
    EXPECT_EQ(judged, 0);
}

} // namespace
