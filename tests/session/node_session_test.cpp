// SPDX-License-Identifier: Apache-2.0
#include "platform/store/raw_sqlite.h"
#include "support/local_node.h"
#include "support/log_capture.h"

#include <ovracgi/ovracgi.h>
#include <ovradrnode/node_session.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/api_registry.h>
#include <ovraplatform/session_store.h>

#include <gtest/gtest.h>
#include <json-c/json_object.h>

#include <cstdlib>
#include <fstream>

using namespace OvraDRNode;
using OvraPlatform::apiError;
using OvraPlatform::apiSuccess;

namespace {

/// A session of another application for the node "n1", created without the library.
std::string foreignSession(const char *user) {
    OvraCgi handle{};
    OvraCgiInit("", &handle);
    std::snprintf(handle.user, sizeof(handle.user), "%s", user);
    const int timeout = 600;
    const int on = 1;
    OvraCgiSetOption(&handle, OVRA_CGI_OPT_SKIP_PASSWORD, &on);
    OvraCgiSetOption(&handle, OVRA_CGI_OPT_APP, "desktop");
    OvraCgiSetOption(&handle, OVRA_CGI_OPT_TIMEOUT, &timeout);
    OvraCgiSetOption(&handle, OVRA_CGI_OPT_EXTRA, R"({"node_id":"n1"})");
    char sid[101] = {};
    EXPECT_EQ(OvraCgiLoginNoAuth(&handle, sid, sizeof(sid), "192.0.2.1"), 1);
    OvraCgiFree(&handle);
    return sid;
}

/// Users joe and ann exist on this appliance.
class Session : public testing::Test {
protected:
    void SetUp() override {
        OvraTest::provisionNode();
        users.add("OVRA.Core.User", 1, "get", OvraPlatform::APIRight::kAdministrator,
                  OvraPlatform::APIQueue::kQuick,
                  [](const Json::Value &params, const OvraPlatform::APICaller &) {
                      const std::string name = params["name"].asString();
                      return name == "joe" || name == "ann" ? apiSuccess() : apiError(1);
                  });
        users.host();
    }
    std::string create(const std::string &node, const std::string &user) {
        return session.CreateNodeSession(node, user);
    }
    std::string userOf(const std::string &sid) { return session.GetUserBySession(sid); }

    OvraPlatform::APIRegistry users;
    NodeSession session;
    LogCapture log;
};

} // namespace

TEST_F(Session, OneNodeAndUserHaveOneSession) {
    const std::string foreign = foreignSession("joe");
    const std::string first = create("n1", "joe");
    EXPECT_EQ(session.GetErrCode(), 0);
    EXPECT_NE(first, foreign) << "another application's is never handed out";
    OvraTest::RawSqlite sessions(OvraPlatform::kSessionsFile);
    EXPECT_EQ(sessions.cell("SELECT ui || ifnull(expires, ' never') FROM session WHERE id = '" +
                            first + "'"),
              R"({"hide":true} never)");
    EXPECT_EQ(log.count("INFO", "node_session", "CreateNodeSession",
                        "Create node session for node[n1] with privielge of userName[joe]"),
              1);
    EXPECT_EQ(create("n1", "joe"), first);
    EXPECT_EQ(log.count("INFO", "node_session", "CreateNodeSession",
                        "session of userName [joe] for node[n1] has been existed"),
              1);
    const std::string other = create("n2", "joe");
    EXPECT_NE(other, first);
    EXPECT_NE(create("n1", "ann"), first);
    EXPECT_EQ(userOf(first) + userOf(other), "joejoe");
    EXPECT_EQ(log.count(first) + log.count(other), 0) << "no line shows a session id";
}

TEST_F(Session, BadArgumentsAndUnknownUsersGetNone) {
    for (const std::string &node : {std::string(), std::string("n\xFF"), std::string(1020, 'n')}) {
        EXPECT_EQ(create(node, "joe") + create("n1", ""), "") << "never found again";
        EXPECT_EQ(session.GetErrCode(), 401);
    }
    EXPECT_EQ(create("n1", "nobody"), "");
    EXPECT_EQ(session.GetErrCode(), 527);
    EXPECT_EQ(session.GetErrMsg().asString(), "nobody");
    for (const unsigned int timeout : {0U, 2147483648U, 4294967295U}) {
        EXPECT_EQ(session.CreateTempSession("joe", timeout), "") << timeout;
        EXPECT_EQ(session.GetErrCode(), 401) << timeout;
    }
    EXPECT_EQ(log.count("WARN", "node_session", "CreateTempSession",
                        "Bad timeout [-2147483648]/userName [joe]"),
              1);
    EXPECT_EQ(session.CreateTempSession("nobody", 5), "");
    EXPECT_EQ(session.GetErrCode(), 527);
    EXPECT_EQ(userOf(""), "");
    EXPECT_EQ(session.GetErrCode(), 401);
    EXPECT_EQ(userOf("no such id"), "");
    EXPECT_EQ(session.GetErrCode(), 528);
}

TEST_F(Session, ATemporaryOneIsTiedToNoNodeAndEnds) {
    const std::string temp = session.CreateTempSession("joe", 7);
    EXPECT_EQ(session.GetErrCode(), 0);
    EXPECT_EQ(userOf(temp), "joe");
    EXPECT_EQ(session.GetErrCode(), 0);
    EXPECT_NE(create("n1", "joe"), temp);
    EXPECT_NE(session.CreateTempSession("joe", 60), temp) << "never reused";
    const std::string row = " WHERE id = '" + temp + "'";
    OvraTest::RawSqlite sessions(OvraPlatform::kSessionsFile);
    EXPECT_EQ(sessions.cell("SELECT expires - created FROM session" + row), "7");
    ASSERT_TRUE(sessions.run("UPDATE session SET expires = expires - 7" + row));
    EXPECT_EQ(userOf(temp), "");
}

TEST_F(Session, RemovalReachesWhatIsOursAndNamedAndNothingElse) {
    const std::string foreign = foreignSession("joe");
    const std::string joe1 = create("n1", "joe");
    const std::string joe2 = create("n2", "joe");
    const std::string joeTemp = session.CreateTempSession("joe", 60);
    const std::string ann = create("n1", "ann");
    session.DeleteBySessionId(joe1);
    EXPECT_EQ(session.GetErrCode(), 0);
    session.DeleteBySessionId(joe1);
    EXPECT_EQ(session.GetErrCode(), 0) << "gone is gone";
    EXPECT_EQ(userOf(joe1), "");
    EXPECT_EQ(userOf(joe2), "joe");
    session.DeleteByUser("joe");
    EXPECT_EQ(session.GetErrCode(), 0);
    EXPECT_EQ(log.count("WARN", "node_session", "RemoveSessionByUser",
                        "Delete session of userName [joe]/[joe] of nodeId[n2]"),
              1);
    EXPECT_EQ(userOf(joe2) + userOf(joeTemp), "");
    EXPECT_EQ(userOf(ann) + userOf(foreign), "annjoe");
    session.DeleteAllNodeSession();
    EXPECT_EQ(session.GetErrCode(), 0);
    EXPECT_EQ(log.count("WARN", "node_session", "DeleteAllNodeSession",
                        "Remove all sessions released by ovradrnode: [success]"),
              1);
    EXPECT_EQ(userOf(ann), "");
    EXPECT_EQ(userOf(foreign), "joe");
}

TEST_F(Session, ALocalLoginShowsThisApplianceAndARemoteOneItsClient) {
    unsetenv("REMOTE_ADDR");
    unsetenv("REMOTE_PORT");
    create("n1", "joe");
    EXPECT_STREQ(getenv("REMOTE_ADDR"), "127.0.0.1");
    EXPECT_STREQ(getenv("REMOTE_PORT"), "5000");
    EXPECT_EQ(log.count("INFO", "node_session", "SetRemoteIP", "Local create session"), 1);
    setenv("REMOTE_ADDR", "192.0.2.7", 1);
    create("n2", "joe");
    EXPECT_STREQ(getenv("REMOTE_ADDR"), "192.0.2.7");
    EXPECT_EQ(log.count("INFO", "node_session", "SetRemoteIP", "create session for [192.0.2.7]"),
              1);
}

TEST_F(Session, AStoreThatCannotBeUsedIsAnErrorOfItsOwn) {
    create("n1", "joe");
    std::ofstream("/usr/ovra/var/ovradr/sessions.db", std::ios::trunc) << std::string(9000, '?');
    EXPECT_EQ(create("n2", "joe"), "");
    EXPECT_EQ(session.GetErrCode(), 511);
    EXPECT_EQ(session.CreateTempSession("joe", 5), "");
    EXPECT_EQ(session.GetErrCode(), 0) << "an empty id says it all";
    session.DeleteBySessionId("x");
    EXPECT_EQ(session.GetErrCode(), 512);
    session.DeleteByUser("joe");
    EXPECT_EQ(session.GetErrCode(), 512);
    session.DeleteAllNodeSession();
    EXPECT_EQ(session.GetErrCode(), 512);
    EXPECT_EQ(log.count("ERR", "node_session", "RemoveSessionByUser",
                        "Failed to remove all node session"),
              1);
    EXPECT_EQ(userOf("x"), "");
    EXPECT_EQ(session.GetErrCode(), 528);
}
