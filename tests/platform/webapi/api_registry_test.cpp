// SPDX-License-Identifier: Apache-2.0
#include <ovraplatform/api_errors.h>
#include <ovraplatform/api_registry.h>
#include <ovrawebapi/api_runner.h>

#include <gtest/gtest.h>

#include <stdexcept>

namespace {

using namespace OvraPlatform;

int codeOf(const Json::Value &reply) {
    return reply["success"].asBool() ? 0 : reply["error"]["code"].asInt();
}

Json::Value echo(const Json::Value &params, const APICaller &caller) {
    Json::Value data;
    data["params"] = params;
    data["caller"] = caller.user +
                     (caller.role == OvraPlatform::Role::kAdministrator ? " administrator" : "") +
                     (caller.local ? " local" : "");
    return apiSuccess(data);
}

const APICaller kNobody{};
const APICaller kUser{"ann", Role::kUser, "s1", "192.0.2.1", false};
const APICaller kAdministrator{"root", Role::kAdministrator, "s2", "192.0.2.1", false};
const APICaller kLocal{"admin", Role::kAdministrator, "", "", true};

TEST(APIRegistry, AnswersWithTheCodeOfTheWireFormAndKnowsTheQueueOfACall) {
    APIRegistry registry;
    registry.add("Open", 1, "get", APIRight::kNone, APIQueue::kQuick, echo);
    registry.add("Mine", 2, "get", APIRight::kSession, APIQueue::kQuick, echo);
    registry.add("All", 1, "set", APIRight::kAdministrator, APIQueue::kOutbound, echo);
    registry.add("Here", 1, "get", APIRight::kLocal, APIQueue::kQuick, echo);
    registry.add("Bad", 1, "throw", APIRight::kNone, APIQueue::kQuick,
                 [](const Json::Value &params, const APICaller &) -> Json::Value {
                     return apiSuccess(params["list"].asInt());
                 });
    registry.add("Bad", 1, "throw_number", APIRight::kNone, APIQueue::kQuick,
                 [](const Json::Value &, const APICaller &) -> Json::Value { throw 7; });
    registry.add("Bad", 1, "no_document", APIRight::kNone, APIQueue::kQuick,
                 [](const Json::Value &, const APICaller &) { return Json::Value("done"); });
    Json::Value list;
    list["list"].append(1);
    const struct {
        const char *name;
        APICall call;
        APICaller caller;
        int code;
    } scenes[] = {{"anybody", {"Open", 1, "get"}, kNobody, 0},
                  {"a user", {"Mine", 2, "get"}, kUser, 0},
                  {"an administrator", {"All", 1, "set"}, kAdministrator, 0},
                  {"no such API", {"Closed", 1, "get"}, kAdministrator, APIError::kNoSuchAPI},
                  {"no such method", {"Open", 1, "set"}, kUser, APIError::kNoSuchMethod},
                  {"no such version", {"Mine", 1, "get"}, kUser, APIError::kNoSuchVersion},
                  {"no session", {"Mine", 2, "get"}, kNobody, APIError::kNoSession},
                  {"no session, more needed", {"All", 1, "set"}, kNobody, APIError::kNoSession},
                  {"no right", {"All", 1, "set"}, kUser, APIError::kNoPermission},
                  {"another machine", {"Here", 1, "get"}, kAdministrator, APIError::kNoPermission},
                  {"a process of the appliance", {"Here", 1, "get"}, kLocal, 0},
                  {"no object", {"Open", 1, "get", "text"}, kUser, APIError::kBadRequest},
                  {"wrong type used", {"Bad", 1, "throw", list}, kUser, APIError::kInternal},
                  {"not an exception", {"Bad", 1, "throw_number"}, kUser, APIError::kInternal},
                  {"no document", {"Bad", 1, "no_document"}, kUser, APIError::kInternal}};
    for (const auto &scene : scenes) {
        EXPECT_EQ(codeOf(registry.dispatch(scene.call, scene.caller)), scene.code) << scene.name;
    }
    EXPECT_EQ(registry.dispatch({"Open", 1, "get", Json::Value()}, kNobody)["data"]["params"],
              Json::Value(Json::objectValue));
    registry.add("A", 1, "get", APIRight::kNone, APIQueue::kQuick, echo);
    registry.add("A", 2, "get", APIRight::kNone, APIQueue::kRelay, echo,
                 [](const Json::Value &params) {
                     return params.isString() ? APIQueue::kRelay : APIQueue::kOutbound;
                 });
    EXPECT_EQ(registry.queue({"A", 1, "get"}), APIQueue::kQuick);
    EXPECT_EQ(registry.queue({"A", 2, "get"}), APIQueue::kOutbound);
    EXPECT_EQ(registry.queue({"A", 2, "get", "text"}), APIQueue::kRelay);
    EXPECT_EQ(registry.queue({"B", 1, "get"}), APIQueue::kQuick);
}

TEST(APIRunner, RunsTheHandlersThatItsProcessHostsAsALocalAdministrator) {
    Json::Value out;
    {
        APIRegistry registry;
        registry.add("All", 1, "set", APIRight::kAdministrator, APIQueue::kQuick, echo);
        registry.host();
        ASSERT_TRUE(OVRA::APIRunner().Exec(out, "All", 1, "set", Json::Value(), "admin"));
        EXPECT_EQ(out["data"]["caller"], "admin administrator local");
        EXPECT_FALSE(OVRA::APIRunner().Exec(out, "All", 1, "set", Json::Value(), nullptr));
        EXPECT_EQ(codeOf(out), APIError::kBadRequest);
    }
    EXPECT_EQ(APIRegistry::hosted(), nullptr);
}

} // namespace
