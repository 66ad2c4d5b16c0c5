// SPDX-License-Identifier: Apache-2.0
#include "handlers/flow_error.h"
#include "handlers/params.h"

#include <ovradrcore/json.h>

#include <gtest/gtest.h>
#include <json/json.h>

#include <functional>

namespace {

using Ovradrd::Params;

Json::Value parse(const std::string &text) {
    Json::Value value;
    EXPECT_TRUE(OvraDRCore::fromString(value, text)) << text;
    return value;
}

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
            for (const Json::Value &value : parse(usable ? scene.usable : scene.refused)) {
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
    const Json::Value params = parse(R"({"y": 7})");
    Params in(params);
    in.text("y", 4);
    in.text("x", 4);
    EXPECT_EQ(in.error()["error"]["code"], 106);
    EXPECT_EQ(in.error()["error"]["msg"]["param"], "y");
}

TEST(FlowError, PassesTheCodeAndMessageOn) {
    const OvraDRCore::ErrRecorder flow;
    flow.SetErr(518, "n2");
    EXPECT_EQ(Ovradrd::flowError(flow, 509)["error"], parse(R"({"code":518,"msg":"n2"})"));
    flow.SetErr(0);
    EXPECT_EQ(Ovradrd::flowError(flow, 509)["error"]["code"], 509);
}

TEST(FlowError, DoesNotPassOffAnotherNodesRefusalAsItsOwn) {
    const OvraDRCore::ErrRecorder flow;
    for (const int refusal : {105, 119}) {
        flow.SetErr(refusal);
        EXPECT_EQ(Ovradrd::flowError(flow, 509)["error"]["code"], 525);
    }
}

} // namespace
