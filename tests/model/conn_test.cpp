// SPDX-License-Identifier: Apache-2.0
#include "support/log_capture.h"

#include <ovradrcore/json.h>
#include <ovradrnode/conn.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/api_registry.h>

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

using namespace OvraDRNode;
using OvraDRCore::SqliteValueList;

TEST(Conn, IsValidWithAnAddressAProtocolAndAPort) {
    const std::pair<Conn, bool> cases[] = {
        {Conn(), false},
        {Conn::http("h", 80), true},
        {Conn::https("h", 65535), true},
        {Conn::https("h", 65536), false},
        {Conn::https("h", 0), false},
        {Conn::https("h", -1), false},
        {Conn::http("", 80), false},
        {Conn::farlink("alias"), true},
        {Conn::farlink(""), false},
        {Conn("alias", "flk", -1), true},
        {Conn("h", "ftp", 21), false},
        {Conn("h", "HTTP", 80), false},
        {Conn("h", "https ", 443), false},
        {Conn("h", "", 443), false},
    };
    for (const auto &[conn, valid] : cases) {
        EXPECT_EQ(conn.isValid(), valid) << conn.toJson();
    }
    EXPECT_EQ(Conn::farlink("a").port, 443);
}

TEST(Conn, ComparesFieldByFieldAndSurvivesItsJsonForm) {
    const Conn conn = Conn::https("h", 5001);
    EXPECT_TRUE(conn == Conn("h", "https", 5001));
    for (const Conn &other :
         {Conn::https("h", 5002), Conn::http("h", 5001), Conn::https("i", 5001)}) {
        EXPECT_TRUE(conn != other);
    }
    for (const Conn &each : {conn, Conn(), Conn("x", "ftp", 99999)}) {
        EXPECT_TRUE(Conn::fromJson(each.toJson()) == each);
    }
}

TEST(Conn, JsonOfAnotherShapeIsInvalidAndLogged) {
    for (const char *text : {"null", "[]", "7", "\"h\"", "{}", R"({"addr":"h","protocol":"https"})",
                             R"({"addr":1,"protocol":"https","port":1})",
                             R"({"addr":"h","protocol":"https","port":"1"})",
                             R"({"addr":"h","protocol":null,"port":1})",
                             R"({"addr":"h","protocol":"p","port":1e99})"}) {
        LogCapture log;
        Json::Value value;
        ASSERT_TRUE(OvraDRCore::fromString(value, text));
        EXPECT_TRUE(Conn::fromJson(value) == Conn()) << text;
        EXPECT_EQ(log.count("WARN", "conn", "fromJson",
                            "Bad Parameter to parse conn: [" + OvraDRCore::toString(value) + "]."),
                  1);
    }
}

TEST(Conn, RowsGiveAndTakeOnlyItsOwnColumns) {
    Conn conn = Conn::http("old", 1);
    EXPECT_TRUE(conn.FromSqliteValues(Conn::https("h", 9).ToSqliteValues({"port", "node_id"})));
    SqliteValueList foreign;
    foreign.AddValue("session", "x");
    EXPECT_FALSE(conn.FromSqliteValues(foreign));
    EXPECT_TRUE(conn == Conn::http("old", 9));
}

namespace {

void configure(const std::string &lines) {
    std::filesystem::create_directories("/usr/ovra/etc/ovradr");
    std::ofstream("/usr/ovra/etc/ovradr/ovradrd.conf") << lines;
}

std::string texts(const std::vector<Conn> &conns) {
    std::string all;
    for (const Conn &conn : conns) {
        all += conn.protocol + ":" + conn.addr + ":" + std::to_string(conn.port) + " ";
    }
    return all;
}

} // namespace

TEST(LocalConn, EveryAddressIsListedWithBothPortsThenTheRelay) {
    configure("address=\"192.0.2.1\"\n");
    EXPECT_EQ(texts(Conn::listLocal()), "") << "no address of this machine";
    configure("address=\"127.0.0.1,127.0.0.2\"\nhttp_port=\"81\"\nhttps_port=\"444\"\n");
    EXPECT_EQ(texts(Conn::listLocal()), "https:127.0.0.1:444 http:127.0.0.1:81 "
                                        "https:127.0.0.2:444 http:127.0.0.2:81 ");
    OvraPlatform::APIRegistry registry;
    Json::Value farlink;
    registry.add("OVRA.Core.Farlink", 1, "get", OvraPlatform::APIRight::kAdministrator,
                 OvraPlatform::APIQueue::kQuick,
                 [&](const Json::Value &, const OvraPlatform::APICaller &caller) {
                     EXPECT_EQ(caller.user, "admin");
                     return OvraPlatform::apiSuccess(farlink);
                 });
    registry.host();
    farlink["enabled"] = true;
    EXPECT_FALSE(Conn::localFarlink().isValid()) << "enabled, but without an alias";
    farlink["server_alias"] = "relay-a";
    EXPECT_EQ(texts({Conn::listLocal().back()}), "flk:relay-a:443 ");
    for (const Json::Value &notOn : {Json::Value(false), Json::Value("true")}) {
        farlink["enabled"] = notOn;
        EXPECT_FALSE(Conn::localFarlink().isValid()) << notOn.asString();
    }
}

TEST(LocalConn, OnlyARelayEndpointIsTranslated) {
    LogCapture log;
    EXPECT_TRUE(Conn::translateFarlink(Conn::https("h", 1)) == Conn::https("h", 1));
    EXPECT_EQ(log.lines().size(), 0U);
    EXPECT_FALSE(Conn::translateFarlink(Conn::farlink("nobody")).isValid());
    EXPECT_EQ(log.count("ERR", "conn", "translateFarlink",
                        "Failed to find info[null] of farlink[nobody]"),
              1);
}
