// SPDX-License-Identifier: Apache-2.0
#include "support/node_fixture.h"
#include "transport/conn_cache.h"
#include "transport/node_valid_cred_cache.h"

#include <ovradrnode/cred_permission_cache.h>
#include <ovradrnode/node_candidates.h>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

std::string textOf(const std::vector<NodeCandidate> &candidates) {
    std::string text;
    for (const NodeCandidate &candidate : candidates) {
        const Json::Value json = candidate.toJson();
        EXPECT_EQ(OvraDRCore::toString(json).find("secret"), std::string::npos);
        text += (text.empty() ? "" : ", ") + json["cred_id"].asString() + " " +
                json["outlook"].asString() + (json["remembered"].asBool() ? "*" : "");
    }
    return text;
}

using NodeCandidates = TwoNodes;

} // namespace

TEST_F(NodeCandidates, AreListedAsTheSenderThenTriesThem) {
    stopClock();
    const struct {
        const char *what;
        const char *remembered;
        int age;             // of the remembered credential, in seconds
        const char *refused; // the credential without the right
        const char *dead;    // the credential whose endpoint does not answer
        int verdictAge;
        const char *listed;
        const char *used; // the session of the request
    } cases[] = {
        {"nothing is known", "", 9, "", "", 9, "c1 next, c2 later, t1 later", "secret-c1 info"},
        {"remembered", "c2", 1, "", "", 9, "c2 next*, c1 later, t1 later", "secret-c2 info"},
        {"temporary", "t1", 9, "", "", 9, "t1 next*, c1 later, c2 later", "secret-t1 info"},
        {"dead", "c1", 1, "", "c1", 1, "c1 unreachable*, c2 next, t1 later", "secret-c2 info"},
        {"dead and stale", "c1", 9, "", "c1", 1, "c2 next, c1 unreachable*, t1 later",
         "secret-c2 info"},
        {"right is lost, but it is too early to ask", "c1", 1, "c1", "", 1,
         "c1 next*, c2 later, t1 later", "secret-c1 info"},
        {"right is lost", "c1", 9, "c1", "", 1, "c2 next, c1 later*, t1 later", "secret-c2 info"},
        {"old verdicts count for nothing", "c1", 9, "c1", "c1", 7, "c1 next*, c2 later, t1 later",
         "secret-c1 info"},
    };
    RemoteNode other; // the endpoint of c1
    other.trust();
    for (const char *id : {"c1", "c2", "t1"}) {
        addCred(*id == 't' ? "temp_cred" : "node_cred", "n1", id, "https",
                (std::string(id) == "c1" ? other : remote).port(), std::string("secret-") + id);
    }
    for (const auto &each : cases) {
        now += 1'000'000'000;
        const auto store = [](const OvraDRCore::Cache &cache, const Json::Value &value, long age) {
            now -= age * 1000;
            cache.UpdateWithData(value);
            now += age * 1000;
        };
        store(NodeValidCredCache("n1"), each.remembered, each.age);
        for (const char *id : {"c1", "c2", "t1"}) {
            store(CredPermissionCache(id), std::string(id) != each.refused, each.verdictAge);
        }
        store(ConnCache(conn), true, each.verdictAge);
        store(ConnCache(Conn::https("127.0.0.1", other.port())), *each.dead == '\0',
              each.verdictAge);
        remote.forgetCalls();
        other.forgetCalls();
        EXPECT_EQ(textOf(listNodeCandidates("n1")), each.listed) << each.what;
        EXPECT_EQ(textOf(listAllNodeCandidates().at("n1")), each.listed) << each.what;
        EXPECT_EQ(remote.calls() + other.calls(), "") << each.what << ": nothing is sent";
        EXPECT_TRUE(NodeSender("n1").process(info).isSuccess());
        EXPECT_EQ(remote.count(each.used) + other.count(each.used), 1) << each.what;
    }
    EXPECT_TRUE(listNodeCandidates("n9").empty());
    EXPECT_TRUE(listNodeCandidates(DRNode::getLocalNodeId()).empty());
}
