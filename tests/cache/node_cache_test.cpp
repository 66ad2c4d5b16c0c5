// SPDX-License-Identifier: Apache-2.0
#include "cache_file.h"
#include "support/node_fixture.h"
#include "transport/conn_cache.h"

#include <ovradrnode/node_cache.h>

#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <csignal>
#include <ctime>
#include <future>
#include <thread>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

/// The nodes "n1" with the credential c1 and "n2" with d1, which has no right, and d2.
class NodeInfo : public TwoNodes {
protected:
    NodeInfo() {
        stopClock();
        other.trust();
        addNodeCred("c1", "s1");
        addCred("node_cred", "n2", "d1", "https", other.port(), "z1");
        addCred("node_cred", "n2", "d2", "https", other.port(), "z2");
        remote.answer("info", R"({"success":true,"data":{"hostname":"b","serial":"S",)"
                              R"("additional":{"timezone":"Asia/Tokyo"}}})");
    }

    RemoteNode other;
    NodeCache cache{"n1", false};
};

} // namespace

TEST_F(NodeInfo, IsAskedOncePerMinute) {
    EXPECT_EQ(cache.GetHostName() + cache.GetSerialNum() + cache.GetTimeZone(), "bSAsia/Tokyo");
    EXPECT_EQ(remote.params("info"), R"({"additional":["timezone"]})");
    remote.answer("info", R"({"success":true,"data":{"hostname":"c","serial":7}})");
    now += 60'000;
    EXPECT_EQ(cache.GetHostName(), "b");
    now += 1;
    EXPECT_EQ(cache.GetHostName(), "c");
    EXPECT_EQ(cache.GetSerialNum() + cache.GetTimeZone(), "")
        << "odd members are unknown, not fatal";
    EXPECT_EQ(OvraDRCore::toString(cache.GetInfo()), R"({"name":"node cache","node_id":"n1"})");
}

TEST_F(NodeInfo, ANodeThatRefusesOrIsAwayKeepsWhatItSaidLast) {
    EXPECT_EQ(cache.GetHostName(), "b");
    remote.answer("info", R"({"success":false,"error":{"code":999}})");
    EXPECT_FALSE(cache.Update());
    now += 61'000;
    EXPECT_EQ(cache.GetHostName(), "b");
    remote.die();
    now += 3600'000;
    EXPECT_EQ(cache.GetHostName(), "b");
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(cache.GetHostName(), "b");
    EXPECT_EQ(cache.GetCachedAge(), 0) << "when it was asked";
    EXPECT_EQ(cache.GetLearntAge(), 3661) << "when it answered";
}

TEST_F(NodeInfo, TheLocalNodeNeedsAWholeAnswer) {
    Json::Value data;
    ASSERT_TRUE(OvraDRCore::fromString(
        data, R"({"hostname":"here","serial":"L","additional":{"timezone":"UTC"}})"));
    host("OVRA.DR.Node", "info",
         [&](const Json::Value &, const auto &) { return OvraPlatform::apiSuccess(data); });
    NodeCache local(DRNode::getLocalNodeId(), false);
    for (const char *stored : {"null", "[]", R"({"hostname":"old","serial":"L"})",
                               R"({"hostname":"old","serial":"L","additional":"x"})"}) {
        Json::Value value;
        ASSERT_TRUE(OvraDRCore::fromString(value, stored));
        local.UpdateWithData(value);
        EXPECT_EQ(local.GetHostName(), "here") << stored;
    }
    data["hostname"] = "renamed";
    now += 5001;
    EXPECT_EQ(local.GetHostName(), "renamed");
    EXPECT_TRUE(local.IsUpdatedDataRequired());
    EXPECT_FALSE(cache.IsUpdatedDataRequired());
}

TEST_F(NodeInfo, OfTwoNodesAndAllElseLearntIsKeptApartUnderItsNames) {
    other.answer("z1 test_privilege", R"({"success":false,"error":{"code":105}})");
    other.answer("info", R"({"success":true,"data":{"hostname":"two"}})");
    EXPECT_EQ(cache.GetHostName(), "b");
    EXPECT_EQ(NodeCache("n2", true).GetHostName(), "two");
    EXPECT_EQ(remote.calls(), "probe, s1 test_privilege, s1 info");
    EXPECT_EQ(other.calls(), "probe, z1 test_privilege, z2 test_privilege, z2 info");
    other.die();
    EXPECT_FALSE(BaseSender::IsConnectable(Conn::https("127.0.0.1", other.port())));
    const std::string host = "_127.0.0.1";
    const std::array<std::string, 3> cases[] = {
        {"node", "n2", R"({"hostname":"two"})"},
        {"dr_node_cred_cache", "node_valid_cred_n1", "\"c1\""},
        {"dr_node_cred_cache", "node_valid_cred_n2", "\"d2\""},
        {"dr_cred_premission_cache", "cred_permission_c1", "true"},
        {"dr_cred_premission_cache", "cred_permission_d1", "false"},
        {"dr_cred_premission_cache", "cred_permission_d2", "true"},
        {"dr_node_conn_cache", "conn_https_" + std::to_string(conn.port) + host, "true"},
        {"dr_node_conn_cache", "conn_https_" + std::to_string(other.port()) + host, "false"},
    };
    for (const auto &[file, entry, value] : cases) {
        const auto stored = OvraDRCore::CacheFile("/tmp/.ovradrcache//" + file).read(entry, 3);
        EXPECT_EQ(stored ? stored->value : "", value) << entry;
    }
}

TEST_F(NodeInfo, NobodyWaitsForTheProbeOfAnEndpointThatWasDead) {
    ConnCache(conn).UpdateWithData(false, now / 1000 - 8, now / 1000 - 8);
    std::promise<void> begun;
    std::promise<void> released;
    remote.before("probe", [&] {
        begun.set_value();
        released.get_future().wait();
    });
    auto prober =
        std::async(std::launch::async, [&] { return BaseSender::GetCachedConnectable(conn); });
    begun.get_future().wait();
    EXPECT_FALSE(BaseSender::GetCachedConnectable(conn));
    EXPECT_NE(prober.wait_for(std::chrono::seconds(0)), std::future_status::ready);
    released.set_value();
    EXPECT_TRUE(prober.get());
    EXPECT_TRUE(BaseSender::GetCachedConnectable(conn));
}

TEST_F(NodeInfo, ProcessesStoppedInTheirProbesHoldOthersUpOnceAndHaveOldNewsLater) {
    OvraDRCore::setSystemClock(nullptr);
    std::array<pid_t, 2> stopped{};
    std::atomic<std::size_t> probes{0};
    remote.before("probe", [&] {
        remote.answer("probe", probes < stopped.size() ? Answer::silence() : Answer::html());
        ++probes;
    });
    const auto send = [this] { return NodeSender("n1").process(info).isSuccess(); };
    for (pid_t &child : stopped) {
        child = fork();
        if (child == 0) {
            _exit((&child == stopped.data() ? send() : BaseSender::IsConnectable(conn)) ? 0 : 1);
        }
    }
    while (probes < stopped.size()) {
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    for (const pid_t child : stopped) {
        kill(child, SIGSTOP);
    }
    for (const double limit : {20.0, 9.0}) {
        const std::time_t start = std::time(nullptr);
        EXPECT_TRUE(send());
        EXPECT_LT(std::difftime(std::time(nullptr), start), limit);
        std::this_thread::sleep_for(std::chrono::seconds(1));
        ConnCache(conn).UpdateWithData(true, 1, 1);
    }
    EXPECT_TRUE(send());
    EXPECT_EQ(probes, stopped.size() + 3);
    for (const pid_t child : stopped) {
        kill(child, SIGCONT);
        waitpid(child, nullptr, 0);
        EXPECT_TRUE(ConnCache(conn).getStoredVerdict());
    }
}
