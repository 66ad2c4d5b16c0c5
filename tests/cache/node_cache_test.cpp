// SPDX-License-Identifier: Apache-2.0
#include "clock.h"
#include "support/local_node.h"
#include "support/log_capture.h"
#include "support/remote_node.h"

#include <ovradrcore/json.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_cache.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/api_registry.h>

#include <gtest/gtest.h>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

std::int64_t now = 3'000'000'000'000;

/// The remote node "n1" with one credential.
class NodeInfo : public testing::Test {
protected:
    void SetUp() override {
        provisionNode();
        OvraDRCore::setSystemClock([] { return now; });
        addCred("node_cred", "n1", "c1", "https", remote.port(), "s1");
        remote.answer("info", R"({"success":true,"data":{"hostname":"b","serial":"S",)"
                              R"("additional":{"timezone":"Asia/Tokyo"}}})");
    }
    void TearDown() override { OvraDRCore::setSystemClock(nullptr); }

    RemoteNode remote;
    NodeCache cache{"n1", false};
    LogCapture log;
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

TEST_F(NodeInfo, ANodeThatIsAwayKeepsWhatItSaidLast) {
    EXPECT_EQ(cache.GetHostName(), "b");
    remote.die();
    now += 3600'000;
    EXPECT_EQ(cache.GetHostName(), "b");
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(cache.GetHostName(), "b");
}

TEST_F(NodeInfo, AnErrorAnswerLeavesTheOldEntry) {
    EXPECT_EQ(cache.GetHostName(), "b");
    remote.answer("info", R"({"success":false,"error":{"code":999}})");
    EXPECT_FALSE(cache.Update());
    now += 61'000;
    EXPECT_EQ(cache.GetHostName(), "b");
}

TEST_F(NodeInfo, TheLocalNodeNeedsAWholeAnswer) {
    OvraPlatform::APIRegistry registry;
    Json::Value data;
    ASSERT_TRUE(OvraDRCore::fromString(
        data, R"({"hostname":"here","serial":"L","additional":{"timezone":"UTC"}})"));
    registry.add("OVRA.DR.Node", 1, "info", OvraPlatform::APIRight::kAdministrator,
                 OvraPlatform::APIQueue::kQuick,
                 [&](const Json::Value &, const OvraPlatform::APICaller &) {
                     return OvraPlatform::apiSuccess(data);
                 });
    registry.host();
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
