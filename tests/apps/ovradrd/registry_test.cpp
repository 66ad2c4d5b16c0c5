// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "handlers/auth.h"
#include "ovradrnode/node_api.h"
#include "support/doc_page.h"
#include "webapi/api_registry.h"

#include <algorithm>
#include <map>

namespace {

using OvraPlatform::APILane;
using OvraPlatform::APIRegistry;
using OvraPlatform::APIRight;

/// As the table names a method.
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
    if (Ovradrd::LoginDesk::isLogin({method.api, method.version, method.method})) {
        return "log-in";
    }
    return method.lane == APILane::kQuick ? "quick" : "slow";
}

class Registry : public OvraTest::Appliance {
protected:
    static std::vector<APIRegistry::Method> registered() {
        return APIRegistry::hosted()->methods();
    }
};

TEST_F(Registry, isDocumentedWithItsRightsAndQueues) {
    std::map<std::string, OvraTest::DocPage::Row> rows;
    for (const auto &row : OvraTest::DocPage("docs/ovradrd.md").rows("What can be called")) {
        ASSERT_EQ(row.size(), 5U) << row[0];
        EXPECT_TRUE(rows.emplace(row[0], row).second)
            << "docs/ovradrd.md has two rows for " << row[0] << ": remove one";
    }
    for (const APIRegistry::Method &method : registered()) {
        const std::string name = nameOf(method.api, method.version, method.method);
        const auto row = rows.find(name);
        if (row == rows.end()) {
            ADD_FAILURE() << "docs/ovradrd.md has no row for " << name
                          << ": add one under \"What can be called\":\n| " << name << " | "
                          << wordOf(method.right) << " | " << queueOf(method)
                          << " | PARAMETERS | DATA |";
            continue;
        }
        // Behind a semicolon stands what the handler itself asks for.
        EXPECT_EQ(row->second[1].substr(0, row->second[1].find(';')), wordOf(method.right))
            << "docs/ovradrd.md: correct the right of " << name;
        EXPECT_EQ(row->second[2], queueOf(method))
            << "docs/ovradrd.md: correct the queue of " << name;
        rows.erase(row);
    }
    for (const auto &[name, row] : rows) {
        ADD_FAILURE() << "docs/ovradrd.md describes " << name
                      << ", which the daemon does not register: correct or remove the row";
    }
}

TEST_F(Registry, answersWhatTheLibraryAsks) {
    namespace WebAPI = OvraDRNode::WebAPI;
    const OvraDRNode::Conn conn("192.0.2.1", "https", 5001);
    const OvraDRCore::Request info = WebAPI::getDRNodeInfoAPI({});
    const OvraDRCore::Request requests[] = {
        info,
        WebAPI::OvraCoreUserGetAPI("a"),
        WebAPI::getDRNodeSessionCreateAPI("n"),
        WebAPI::getDRNodeSessionTempCreateAPI(),
        WebAPI::getDRNodeSessionDeleteAPI("s"),
        WebAPI::getDRNodeSessionGetAPI("s"),
        WebAPI::getDRNodeTestPrivilegeAPI(),
        WebAPI::getDRNodeTestConnectionAPI({conn}),
        WebAPI::getDRNodeTestSyncSpeedAPI("n", 0, 1),
        WebAPI::getDRNodeTestDownloadSpeedAPI("http://n:1/", 0, 1),
        WebAPI::getDRNodeCredCreateAPI("c"),
        WebAPI::getDRNodeCredGetAPI("c"),
        WebAPI::getDRNodeCredSetAPI("c", conn, "a", "p", ""),
        WebAPI::getDRNodeCredRelayAPI("c", info),
        WebAPI::getDRNodeCredReverseCreateAPI("c", conn),
        WebAPI::getDRNodeTestCredReverseCreateAPI("c", conn),
        WebAPI::getDRNodeTestCredCreateAPI(conn, "a", "s"),
        WebAPI::getDRNodeTestCredSetAPI("c", conn, "a", "p", ""),
        WebAPI::getDRNodeTempCredCreateAPI(conn, "s"),
        WebAPI::getDRNodeTempCredReverseCreateAPI("c", conn),
    };
    const std::vector<APIRegistry::Method> methods = registered();
    for (const OvraDRCore::Request &request : requests) {
        const bool known = std::any_of(methods.begin(), methods.end(), [&](const auto &method) {
            return method.api == request.getAPI() && method.version == request.getVersion() &&
                   method.method == request.getMethod();
        });
        EXPECT_TRUE(known) << "no handler is registered for "
                           << nameOf(request.getAPI(), request.getVersion(), request.getMethod());
    }
}

} // namespace
