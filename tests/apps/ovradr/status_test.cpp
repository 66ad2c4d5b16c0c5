// SPDX-License-Identifier: Apache-2.0
#include "scripted_node.h"
#include "shared/overview.h"
#include "status_view.h"

#include <ovrabase/utf8.h>
#include <ovradrcore/err_recorder.h>
#include <ovradrcore/json.h>
#include <ovradrnode/dr_node.h>

#include <csignal>
#include <ctime>

namespace OvradrTest {

namespace {

using OvraApps::DaemonFacts;
using OvraApps::OverviewRequest;
using OvraApps::WayFacts;
using OvraTest::addCred;

/// A way that answers, asked just now.
WayFacts good() {
    WayFacts way;
    way.asked = std::time(nullptr);
    way.answers = true;
    way.lastSeen = way.asked;
    way.nodeId = "n1";
    return way;
}

WayFacts failing(int code, bool answers = true) {
    WayFacts way = good();
    way.code = code;
    way.answers = answers;
    return way;
}

/// What the overview says is wrong, each with its exit code and the credential.
std::string problemsOf(const DaemonFacts &facts) {
    OverviewRequest request;
    request.daemon = &facts;
    const Json::Value overview = OvraApps::makeOverview(request);
    EXPECT_EQ(OvraDRCore::toString(overview).find("s3cret"), std::string::npos);
    std::string text;
    for (const Json::Value &problem : overview["problems"]) {
        text += (text.empty() ? "" : ", ") + problem["kind"].asString() + " " +
                problem["exit"].asString() + " " + problem["cred_id"].asString();
        EXPECT_FALSE(problem["command"].asString().empty());
    }
    return text;
}

} // namespace

TEST(Overview, NamesEachProblemWithItsExitCodeTheGravestFirst) {
    ASSERT_EQ(run({"setup"}).exit, 0);
    addCred("node_cred", "n1", "c1", "https", 1, "s3cret1");
    addCred("node_cred", "n1", "c2", "https", 2, "s3cret2");
    WayFacts other = good();
    other.nodeId = "n2";
    WayFacts early = good();
    early.clockAhead = -30.1;
    WayFacts intime = good();
    intime.clockAhead = 29.9;
    const WayFacts dead = failing(OvraDRCore::ERR::kNotConnectable, false);
    const WayFacts changed = failing(OvraDRCore::ERR::kCertificateChanged, false);
    const std::tuple<WayFacts, WayFacts, const char *> scenes[] = {
        {good(), intime, ""},
        {good(), dead, "spare_way 3 c2"},
        {dead, dead, "not_reachable 3 "},
        {failing(119), good(), "no_session 4 c1"},
        {good(), failing(OvraDRCore::ERR::kNoPrivilege), "no_permission 8 c2"},
        {changed, good(), "certificate_changed 6 c1"},
        {changed, changed, "certificate_changed 6 c1, certificate_changed 6 c2"},
        {changed, dead, "certificate_changed 6 c1, spare_way 3 c2"},
        {other, good(), "wrong_node 12 c1"},
        {early, early, "clock 13 "},
        {failing(100), early, "request_failed 1 c1, clock 13 "},
        {early, failing(119), "clock 13 , no_session 4 c2"},
    };
    for (const auto &[first, second, problems] : scenes) {
        EXPECT_EQ(problemsOf({0, {{"c1", first}, {"c2", second}}, {}}), problems);
    }
    EXPECT_EQ(problemsOf({}), "") << "what nobody asked is no problem";
}

TEST(Overview, DescribesPeersByPagesAndQuotesWhatAPeerChose) {
    ASSERT_EQ(run({"setup"}).exit, 0);
    for (const char *id : {"n1", "n2", "x; reboot"}) {
        addCred("node_cred", id, std::string("c-") + id[0] + id[1], "https", 1, "s3cret");
    }
    DaemonFacts facts;
    facts.ways["c-x;"] = failing(OvraDRCore::ERR::kNotConnectable, false);
    OverviewRequest request;
    request.daemon = &facts;
    request.limit = 2;
    const Json::Value first = OvraApps::makeOverview(request);
    EXPECT_EQ(first["peers"][0]["node_id"], "x; reboot") << "problems come first";
    EXPECT_EQ(first["problems"][0]["command"], "ovradr doctor 'x; reboot'");
    EXPECT_EQ(OvraApps::shellWord("it's"), R"('it'\''s')");
    EXPECT_EQ(first["peers"][1]["node_id"], "n1");
    EXPECT_FALSE(first["peers"][1]["reach"].isMember("answers")) << "nobody asked";
    request.offset = first["next"].asUInt();
    const Json::Value second = OvraApps::makeOverview(request);
    EXPECT_EQ(second["peers"].size(), 1U);
    EXPECT_EQ(second["peers"][0]["node_id"], "n2");
    EXPECT_FALSE(second.isMember("next"));
    EXPECT_EQ(second["peer_count"].asUInt(), 3U);
}

TEST(Status, TellsWithoutADaemonWhatItKnowsAndThatNoneAnswers) {
    ASSERT_EQ(run({"setup"}).exit, 0);
    addCred("node_cred", "n1", "c1", "https", 1, "s3cret");
    const Result result = run({"status"});
    EXPECT_EQ(result.exit, 3);
    for (const char *shown : {"The daemon of this appliance does not answer.", "n1"}) {
        EXPECT_NE(result.out.find(shown), std::string::npos) << result.out;
    }
    const Json::Value document = run({"status", "--json"}).json();
    EXPECT_EQ(document["data"]["problems"][0]["kind"], "daemon");
    EXPECT_EQ(document["data"]["peers"][0]["reach"]["ways"][0]["cred_id"], "c1");
    EXPECT_EQ(run({"status", "--watch"}).exit, 2) << "there is no terminal";
    EXPECT_EQ(run({"status", "--watch", "0"}).exit, 2);
}

TEST(Status, DrawsAgainAndAgainWithoutClearingTheScreen) {
    ASSERT_EQ(run({"setup"}).exit, 0);
    Terminal terminal({"status", "--watch", "1"});
    for (int frame = 0; frame < 2; ++frame) {
        EXPECT_TRUE(terminal.shows("\x1b[H")) << frame;
        EXPECT_TRUE(terminal.shows("Ctrl-C ends it."));
    }
    terminal.type("\x03");
    EXPECT_EQ(terminal.finish(), 3);
    EXPECT_EQ(terminal.screen().find("\x1b[2J"), std::string::npos);
    EXPECT_NE(terminal.screen().find("\x1b[?1049l"), std::string::npos) << "as it was before";
}

TEST(Screenful, NeitherWrapsNorScrolls) {
    EXPECT_EQ(Ovradr::screenful("abcd\nZürich\n漢字\nlast\n", 3, 3), "abc\nZür\n漢\n");
}

} // namespace OvradrTest
