// SPDX-License-Identifier: Apache-2.0
#include "support/node_fixture.h"
#include "support/other_process.h"
#include "transport/conn_cache.h"

#include <chrono>
#include <deque>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

std::string text(const Conn &conn) {
    return OvraDRCore::toString(conn.toJson());
}

using Probe = TwoNodes;

} // namespace

TEST_F(Probe, TheVerdictIsKeptForItsLifetimeAndThenAskedAgain) {
    stopClock();
    EXPECT_TRUE(BaseSender::GetCachedConnectable(conn));
    EXPECT_TRUE(BaseSender::GetCachedConnectable(conn));
    EXPECT_EQ(remote.calls(), "probe");
    now += 5001;
    EXPECT_TRUE(BaseSender::GetCachedConnectable(conn));
    EXPECT_EQ(remote.calls(), "probe, probe");
    EXPECT_EQ(log.count("Update conn cache"), 0) << "the verdict never changed";
}

TEST_F(Probe, AnEndpointThatRefusesIsHeldUnreachableUntilItComesBack) {
    const Conn dead = Conn::https("127.0.0.1", unusedPort());
    EXPECT_FALSE(BaseSender::IsConnectable(dead));
    EXPECT_EQ(log.count("NOTICE", "sender", "IsConnectableWithErrCheck",
                        "Conn [" + text(dead) + "] is not connectable since cred error[5]"),
              1);
    EXPECT_EQ(log.count("DEBUG", "sender", "IsConnectableWithErrCheck",
                        "Detect conn [127.0.0.1] disconnect costs [0]sec"),
              1);
    EXPECT_EQ(log.count("NOTICE", "sender", "IsConnectable",
                        "Update conn cache [" + text(dead) + "] from [true] to [false]"),
              1);
    EXPECT_FALSE(BaseSender::IsConnectable(dead));
    EXPECT_EQ(log.count("Update conn cache"), 1);
    log.clear();
    EXPECT_FALSE(BaseSender::GetCachedConnectable(dead));
    EXPECT_EQ(log.lines().size(), 0U) << "answered from the cache, no probe";
}

TEST_F(Probe, AHostThatSaysNothingAfterTheHandshakeCostsTheProbesTimeOutOnce) {
    remote.answer("probe", Answer::silence());
    const auto start = std::chrono::steady_clock::now();
    EXPECT_FALSE(BaseSender::IsConnectable(conn)); // a verdict as old as its begin would be stale
    const std::chrono::duration<double> took = std::chrono::steady_clock::now() - start;
    EXPECT_GE(took.count(), 9.0);
    EXPECT_LT(took.count(), 15.0);
    EXPECT_FALSE(BaseSender::GetCachedConnectable(conn));
    EXPECT_EQ(remote.calls(), "probe");
    EXPECT_LT(ConnCache(conn).GetCachedAge(), 5) << "it counts from its end";
    EXPECT_EQ(log.count("cred error[10]"), 1);
}

TEST_F(Probe, ManyProcessesThatAskAtOnceSendOneProbe) {
    std::deque<OtherProcess> processes;
    for (int i = 0; i < 20; ++i) {
        processes.emplace_back([this] { return BaseSender::GetCachedConnectable(conn) ? 0 : 1; });
    }
    for (OtherProcess &process : processes) {
        EXPECT_EQ(process.wait(), 0);
    }
    EXPECT_EQ(remote.calls(), "probe");
}

TEST_F(Probe, AStoredValueThatIsNoVerdictReadsAsConnectableAndIsAskedAgain) {
    const ConnCache cache(conn);
    cache.UpdateWithData("rubbish");
    EXPECT_TRUE(cache.getStoredVerdict());
    EXPECT_TRUE(BaseSender::GetCachedConnectable(conn));
    EXPECT_EQ(remote.calls(), "probe");
    EXPECT_EQ(OvraDRCore::toString(cache.GetInfo()),
              R"({"conn":)" + text(conn) + R"(,"name":"conn cache"})");
}

TEST_F(Probe, ARequestOnThisApplianceIsTheAdministratorsAndItsErrorIsPassedOn) {
    host("A", "m", [](const Json::Value &params, const OvraPlatform::APICaller &caller) {
        EXPECT_EQ(caller.user, "admin");
        return OvraPlatform::apiError(777, params["x"]);
    });
    OvraDRCore::Request request("A", 1, "m", Json::Value());
    request.addParam("x", "why");
    const OvraDRCore::Response response = BaseSender::run(request);
    EXPECT_EQ(response.getErrCode(), 777);
    EXPECT_EQ(response.getErrMsg().asString(), "why");
}
