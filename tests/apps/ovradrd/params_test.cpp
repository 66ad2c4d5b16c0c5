// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "handlers/flow_error.h"
#include "handlers/params.h"

#include <functional>

namespace {

using Ovradrd::Params;
using OvraTest::json;

struct Scene {
    const char *name;
    std::function<void(Params &)> read; ///< the parameter "x"
    const char *usable;                 ///< arrays of values
    const char *refused;
};

const Scene kScenes[] = {
    {"text", [](Params &in) { in.text("x", 4); }, R"(["abcd"])",
     R"(["abcde", "", null, 7, ["a"], "a\n", "\u0000"])"},
    {"secret", [](Params &in) { in.secret("x", 4); }, R"(["a\n"])", R"(["a\u0000", "", "abcde"])"},
    {"optionalText", [](Params &in) { in.optionalText("x", 4); }, R"([null, "", "abcd"])",
     R"([false, "abcde"])"},
    {"texts", [](Params &in) { in.optionalTexts("x", 2, 4); }, R"([null, [], ["a", "b"]])",
     R"([["a", "b", "c"], [1], {"a": "b"}, "a", ["abcde"]])"},
    {"word",
     [](Params &in) {
         in.word("x", {"a", "b"});
     },
     R"(["b"])", R"(["c", null, {}])"},
    {"conn", [](Params &in) { in.conn("x"); }, R"([{"addr": "h", "protocol": "https", "port": 1}])",
     R"([{"addr": "h", "protocol": "https", "port": 0}, {"addr": "h", "protocol": "ftp", "port": 1},
         {"addr": "h", "protocol": "http", "port": "1"}, {"addr": "h", "protocol": "http"},
         {"addr": "h\n", "protocol": "http", "port": 1}, [], null])"},
    {"conns", [](Params &in) { in.conns("x", 2); },
     R"([[{"addr": "h", "protocol": "https", "port": 1}]])", R"([[], [{}], [1, 2, 3], {}, null])"},
    {"object", [](Params &in) { in.object("x"); }, R"([{"a": 1}])", R"([[], null, "a"])"},
};

TEST(Params, AreTakenOrNamedAsUnusable) {
    for (const Scene &scene : kScenes) {
        for (const bool usable : {true, false}) {
            for (const Json::Value &value : json(usable ? scene.usable : scene.refused)) {
                Json::Value params(Json::objectValue);
                params["x"] = value;
                Params in(params);
                scene.read(in);
                EXPECT_EQ(in.ok(), usable) << scene.name << value;
                EXPECT_EQ(in.ok() ? "x" : in.error()["error"]["msg"]["param"].asString(), "x");
            }
        }
    }
}

TEST(Params, NameTheFirstThatIsUnusable) {
    const Json::Value params = json(R"({"y": 7})");
    Params in(params);
    in.text("y", 4);
    in.text("x", 4);
    EXPECT_EQ(in.error()["error"]["code"], 106);
    EXPECT_EQ(in.error()["error"]["msg"]["param"], "y");
}

TEST(FlowError, PassesTheCodeAndMessageOnButNoOtherNodesRefusalAsItsOwn) {
    const OvraDRCore::ErrRecorder flow;
    flow.SetErr(518, "n2");
    EXPECT_EQ(Ovradrd::flowError(flow, 509)["error"], json(R"({"code":518,"msg":"n2"})"));
    for (const auto &[recorded, code] : {std::pair(0, 509), {105, 525}, {119, 525}}) {
        flow.SetErr(recorded);
        EXPECT_EQ(Ovradrd::flowError(flow, 509)["error"]["code"], code);
    }
}

} // namespace
