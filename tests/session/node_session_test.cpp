// SPDX-License-Identifier: Apache-2.0
#include "platform/store/raw_sqlite.h"
#include "support/node_fixture.h"

#include <ovradrnode/node_session.h>
#include <ovraplatform/session_store.h>

#include <cstdlib>
#include <fstream>

using namespace OvraDRNode;

namespace {

class Session : public OvraTest::LocalNode {
protected:
    // Each returns the code of the error in place of an empty text.
    std::string create(const std::string &node, const std::string &user) {
        return orCode(session.CreateNodeSession(node, user));
    }
    std::string createTemp(const std::string &user, unsigned int timeout) {
        return orCode(session.CreateTempSession(user, timeout));
    }
    std::string userOf(const std::string &sid) { return orCode(session.GetUserBySession(sid)); }

    /// A session of another application for the node "n1".
    const std::string foreign =
        OvraPlatform::SessionStore()
            .create({.user = "joe", .app = "desktop", .extra = R"({"node_id":"n1"})"})
            .value_or("");
    NodeSession session;

private:
    std::string orCode(const std::string &text) {
        EXPECT_TRUE(text.empty() || session.GetErrCode() == 0);
        return text.empty() ? std::to_string(session.GetErrCode()) : text;
    }
};

} // namespace

TEST_F(Session, OneNodeAndUserHaveOneSession) {
    const std::string first = create("n1", "joe");
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
        EXPECT_EQ(create(node, "joe") + create("n1", ""), "401401") << "never found again";
    }
    EXPECT_EQ(create("n1", "nobody"), "527");
    EXPECT_EQ(session.GetErrMsg().asString(), "nobody");
    for (const unsigned int timeout : {0U, 2147483648U, 4294967295U}) {
        EXPECT_EQ(createTemp("joe", timeout), "401") << timeout;
    }
    EXPECT_EQ(log.count("WARN", "node_session", "CreateTempSession",
                        "Bad timeout [-2147483648]/userName [joe]"),
              1);
    EXPECT_EQ(createTemp("nobody", 5), "527");
    EXPECT_EQ(userOf(""), "401");
    EXPECT_EQ(userOf("no such id"), "528");
}

TEST_F(Session, ATemporaryOneIsTiedToNoNodeAndEnds) {
    const std::string temp = createTemp("joe", 7);
    EXPECT_EQ(userOf(temp), "joe");
    EXPECT_NE(create("n1", "joe"), temp);
    EXPECT_NE(createTemp("joe", 60), temp) << "never reused";
    const std::string row = " WHERE id = '" + temp + "'";
    OvraTest::RawSqlite sessions(OvraPlatform::kSessionsFile);
    EXPECT_EQ(sessions.cell("SELECT expires - created FROM session" + row), "7");
    ASSERT_TRUE(sessions.run("UPDATE session SET expires = expires - 7" + row));
    EXPECT_EQ(userOf(temp), "528");
}

TEST_F(Session, RemovalReachesWhatIsOursAndNamedAndNothingElse) {
    const std::string joe1 = create("n1", "joe");
    const std::string joe2 = create("n2", "joe");
    const std::string joeTemp = createTemp("joe", 60);
    const std::string ann = create("n1", "ann");
    for (int i = 0; i < 2; ++i) {
        session.DeleteBySessionId(joe1);
        EXPECT_EQ(session.GetErrCode(), 0) << "gone is gone";
    }
    EXPECT_EQ(userOf(joe1), "528");
    EXPECT_EQ(userOf(joe2), "joe");
    session.DeleteByUser("joe");
    EXPECT_EQ(session.GetErrCode(), 0);
    EXPECT_EQ(log.count("WARN", "node_session", "RemoveSessionByUser",
                        "Delete session of userName [joe]/[joe] of nodeId[n2]"),
              1);
    EXPECT_EQ(userOf(joe2) + userOf(joeTemp), "528528");
    EXPECT_EQ(userOf(ann) + userOf(foreign), "annjoe");
    session.DeleteAllNodeSession();
    EXPECT_EQ(session.GetErrCode(), 0);
    EXPECT_EQ(log.count("WARN", "node_session", "DeleteAllNodeSession",
                        "Remove all sessions released by ovradrnode: [success]"),
              1);
    EXPECT_EQ(userOf(ann), "528");
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
    EXPECT_EQ(create("n2", "joe"), "511");
    EXPECT_EQ(createTemp("joe", 5), "0") << "an empty id says it all";
    session.DeleteBySessionId("x");
    EXPECT_EQ(session.GetErrCode(), 512);
    session.DeleteByUser("joe");
    EXPECT_EQ(session.GetErrCode(), 512);
    session.DeleteAllNodeSession();
    EXPECT_EQ(session.GetErrCode(), 512);
    EXPECT_EQ(log.count("ERR", "node_session", "RemoveSessionByUser",
                        "Failed to remove all node session"),
              1);
    EXPECT_EQ(userOf("x"), "528");
}
