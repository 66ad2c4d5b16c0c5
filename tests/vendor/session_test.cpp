// SPDX-License-Identifier: Apache-2.0
#include "vendor/appliance.h"

#include <cstdlib>

using namespace OvraDRNode;
using namespace OvraTest;
using namespace OvraVendor;

namespace {

/// Only the user joe exists.
class GrantedSession : public Appliance {
protected:
    static OvraVendor::Session stored(const std::string &id) {
        for (const OvraVendor::Session &each : cgiLibrary().sessions) {
            if (each.id == id) {
                return each;
            }
        }
        return {};
    }
    static std::string ids() {
        std::string all;
        for (const OvraVendor::Session &each : cgiLibrary().sessions) {
            all += each.id + " ";
        }
        return all;
    }

    NodeSession session;
};

} // namespace

TEST_F(GrantedSession, IsOneForANodeAndAUser) {
    unsetenv("REMOTE_ADDR");
    const std::string id = session.CreateNodeSession("n1", "joe");
    const OvraVendor::Session made = stored(id);
    EXPECT_EQ(made.user + " " + made.app + " " + made.extra, R"(joe Tidewater {"node_id":"n1"})");
    EXPECT_EQ(json(made.ui)["hide"], true);
    EXPECT_EQ(json(made.ui)["title"], "session") << "the rest of the template stays";
    EXPECT_EQ(made.timeout, -1);
    EXPECT_EQ(made.client + " " + std::getenv("REMOTE_PORT"), "127.0.0.1 5000");
    EXPECT_EQ(session.CreateNodeSession("n1", "joe"), id);
    EXPECT_NE(session.CreateNodeSession("n2", "joe"), id) << "the first one stays beside it";
    EXPECT_EQ(ids(), "local-session-1 local-session-2 ");
    EXPECT_EQ(session.GetUserBySession(id), "joe");
    EXPECT_EQ(session.GetUserBySession("unknown"), "");
    EXPECT_EQ(session.GetErrCode(), 528);
    setenv("REMOTE_ADDR", "192.0.2.50", 1);
    EXPECT_EQ(stored(session.CreateTempSession("joe", 300)).client, "192.0.2.50");
}

TEST_F(GrantedSession, IsNotMadeForWhomThereIsNoAccountNorWithoutItsOptions) {
    EXPECT_EQ(session.CreateNodeSession("n1", "nobody"), "");
    EXPECT_EQ(session.GetErrCode(), 527);
    for (const int option : {1, 3, 7, 10}) {
        cgiLibrary().refusedOptions = {option};
        EXPECT_EQ(session.CreateNodeSession("n1", "joe"), "") << option;
        EXPECT_EQ(session.GetErrCode(), 511) << option;
    }
    cgiLibrary().refusedOptions = {9, 11};
    EXPECT_NE(session.CreateNodeSession("n1", "joe"), "") << "can be without these";
    cgiLibrary().refusedOptions.clear();
    const std::string longName(600, 'j');
    webApiLibrary().answer = [](const Call &, const std::string &) {
        return json(R"({"success":true})");
    };
    EXPECT_EQ(stored(session.CreateTempSession(longName, 60)).user, longName.substr(0, 491));
}

TEST_F(GrantedSession, IsRemovedByItsIdItsUserOrWithAllOfThem) {
    cgiLibrary().sessions.push_back({"desktop-1", "joe", "desktop", "", "", "", -1});
    webApiLibrary().answer = [](const Call &, const std::string &) {
        return json(R"({"success":true})");
    };
    const std::string first = session.CreateNodeSession("n1", "joe");
    EXPECT_NE(session.CreateNodeSession("n2", "joe"), "");
    EXPECT_NE(session.CreateTempSession("joe", 300), "");
    const std::string ann = session.CreateNodeSession("n1", "ann");
    session.DeleteBySessionId(first);
    EXPECT_EQ(session.GetErrCode(), 0);
    EXPECT_EQ(session.GetUserBySession(first), "");
    session.DeleteByUser("joe");
    EXPECT_EQ(ids(), "desktop-1 " + ann + " ");
    session.DeleteAllNodeSession();
    EXPECT_EQ(ids(), "desktop-1 ");
}

TEST_F(GrantedSession, FailsWithTheStoreAndStillGivesBackItsHandles) {
    cgiLibrary().broken = true;
    EXPECT_EQ(session.CreateNodeSession("n1", "joe"), "");
    EXPECT_EQ(session.GetErrCode(), 511);
    session.DeleteBySessionId("s");
    EXPECT_EQ(session.GetErrCode(), 512);
    session.DeleteByUser("joe");
    EXPECT_EQ(session.GetErrCode(), 512);
    session.DeleteAllNodeSession();
    EXPECT_EQ(session.GetErrCode(), 512);
    EXPECT_EQ(session.GetUserBySession("s"), "");
    EXPECT_EQ(session.GetErrCode(), 528);
    EXPECT_EQ(cgiLibrary().handles.ever, 6);
}
