// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "handlers/auth.h"
#include "support/doc_page.h"

#include <ovraplatform/api_registry.h>

#include <map>

namespace {

using OvraPlatform::APIQueue;
using OvraPlatform::APIRegistry;
using OvraPlatform::APIRight;

const std::map<APIRight, std::string> kRights{{APIRight::kNone, "anybody"},
                                              {APIRight::kSession, "session"},
                                              {APIRight::kPairing, "pairing"},
                                              {APIRight::kAdministrator, "administrator"},
                                              {APIRight::kLocal, "local"}};
const std::map<APIQueue, std::string> kQueues{{APIQueue::kQuick, "quick"},
                                              {APIQueue::kOutbound, "outbound"},
                                              {APIQueue::kTwoWay, "two-way"},
                                              {APIQueue::kRelay, "relay"}};

class Registry : public OvraTest::Appliance {};

TEST_F(Registry, IsDocumentedWithItsRightsAndQueues) {
    std::map<std::string, OvraTest::DocPage::Row> rows;
    for (const auto &row : OvraTest::DocPage("docs/ovradrd.md").rows("What can be called")) {
        ASSERT_EQ(row.size(), 5U) << row[0];
        EXPECT_TRUE(rows.emplace(row[0], row).second)
            << "docs/ovradrd.md has two rows for " << row[0] << ": remove one";
    }
    for (const APIRegistry::Method &method : APIRegistry::hosted()->methods()) {
        const std::string name =
            "`" + method.api + "` " + std::to_string(method.version) + " `" + method.method + "`";
        const std::string right = kRights.at(method.right);
        const bool isLogin =
            Ovradrd::LoginApi::isLogin({method.api, method.version, method.method});
        const std::string queue = isLogin ? "log-in" : kQueues.at(method.queue);
        const auto row = rows.find(name);
        if (row == rows.end()) {
            ADD_FAILURE() << "docs/ovradrd.md has no row for " << name
                          << ": add one under \"What can be called\":\n| " << name << " | " << right
                          << " | " << queue << " | PARAMETERS | DATA |";
            continue;
        }
        // After a semicolon follow the handler's own requirements.
        EXPECT_EQ(row->second[1].substr(0, row->second[1].find(';')), right)
            << "docs/ovradrd.md: correct the right of " << name;
        EXPECT_EQ(row->second[2].substr(0, row->second[2].find(';')), queue)
            << "docs/ovradrd.md: correct the queue of " << name;
        rows.erase(row);
    }
    for (const auto &[name, row] : rows) {
        ADD_FAILURE() << "docs/ovradrd.md describes " << name
                      << ", which the daemon does not register: correct or remove the row";
    }
}

class Queues : public OvraTest::Appliance {};

TEST_F(Queues, KeepTheWayBackOutOfTheOneThatWaitsForIt) {
    for (const auto &[params, queue] :
         {std::pair(R"("no object")", APIQueue::kOutbound),
          std::pair(R"({"cred_direction":"unidirection"})", APIQueue::kOutbound),
          std::pair(R"({"cred_direction":"bidirection"})", APIQueue::kTwoWay)}) {
        EXPECT_EQ(APIRegistry::hosted()->queue(
                      {"OVRA.DR.Node.Credential", 1, "create", OvraTest::json(params)}),
                  queue)
            << params;
    }
}

} // namespace
