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

/// A method as named in the table.
std::string nameOf(const std::string &api, int version, const std::string &method) {
    return "`" + api + "` " + std::to_string(version) + " `" + method + "`";
}

const char *wordOf(APIRight right) {
    switch (right) {
    case APIRight::kNone:
        return "anybody";
    case APIRight::kSession:
        return "session";
    case APIRight::kAdministrator:
        return "administrator";
    case APIRight::kLocal:
        return "local";
    }
    return "";
}

std::string queueOf(const APIRegistry::Method &method) {
    if (Ovradrd::LoginApi::isLogin({method.api, method.version, method.method})) {
        return "log-in";
    }
    switch (method.queue) {
    case APIQueue::kQuick:
        return "quick";
    case APIQueue::kOutbound:
        return "outbound";
    case APIQueue::kTwoWay:
        return "two-way";
    case APIQueue::kRelay:
        return "relay";
    }
    return "";
}

class Registry : public OvraTest::Appliance {};

TEST_F(Registry, IsDocumentedWithItsRightsAndQueues) {
    std::map<std::string, OvraTest::DocPage::Row> rows;
    for (const auto &row : OvraTest::DocPage("docs/ovradrd.md").rows("What can be called")) {
        ASSERT_EQ(row.size(), 5U) << row[0];
        EXPECT_TRUE(rows.emplace(row[0], row).second)
            << "docs/ovradrd.md has two rows for " << row[0] << ": remove one";
    }
    for (const APIRegistry::Method &method : APIRegistry::hosted()->methods()) {
        const std::string name = nameOf(method.api, method.version, method.method);
        const auto row = rows.find(name);
        if (row == rows.end()) {
            ADD_FAILURE() << "docs/ovradrd.md has no row for " << name
                          << ": add one under \"What can be called\":\n| " << name << " | "
                          << wordOf(method.right) << " | " << queueOf(method)
                          << " | PARAMETERS | DATA |";
            continue;
        }
        // After a semicolon follow the handler's own requirements.
        EXPECT_EQ(row->second[1].substr(0, row->second[1].find(';')), wordOf(method.right))
            << "docs/ovradrd.md: correct the right of " << name;
        EXPECT_EQ(row->second[2].substr(0, row->second[2].find(';')), queueOf(method))
            << "docs/ovradrd.md: correct the queue of " << name;
        rows.erase(row);
    }
    for (const auto &[name, row] : rows) {
        ADD_FAILURE() << "docs/ovradrd.md describes " << name
                      << ", which the daemon does not register: correct or remove the row";
    }
}

TEST_F(Registry, KeepsTheWayBackOutOfTheQueueThatWaitsForIt) {
    const auto queueOf = [](const Json::Value &params) {
        return APIRegistry::hosted()->queue({"OVRA.DR.Node.Credential", 1, "create", params});
    };
    Json::Value params;
    EXPECT_EQ(queueOf("no object"), APIQueue::kOutbound);
    params["cred_direction"] = "unidirection";
    EXPECT_EQ(queueOf(params), APIQueue::kOutbound);
    params["cred_direction"] = "bidirection";
    EXPECT_EQ(queueOf(params), APIQueue::kTwoWay);
}

} // namespace
