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
    const char *params;
    std::function<void(Params &)> read;
    const char *refused; ///< the parameter that the error names; "" for none
};

void readText(Params &in) {
    in.text("x", 4);
}
void readSecret(Params &in) {
    in.secret("x", 4);
}
void readOptional(Params &in) {
    in.optionalText("x", 4);
}
void readTexts(Params &in) {
    in.optionalTexts("x", 2, 4);
}
void readConns(Params &in) {
    in.conns("x", 2);
}
void readConn(Params &in) {
    in.conn("x");
}
void readWord(Params &in) {
    in.word("x", {"a", "b"});
}
void readObject(Params &in) {
    in.object("x");
}
void readTwo(Params &in) {
    in.text("y", 4);
    in.text("x", 4);
}

const Scene kScenes[] = {

    {R"({"x":"abcd"})", readText, ""},
    {R"({"x":"abcde"})", readText, "x"},
    {R"({"x":""})", readText, "x"},
    {R"({})", readText, "x"},
    {R"({"x":7})", readText, "x"},
    {R"({"x":["a"]})", readText, "x"},
    {R"({"x":"a\n"})", readText, "x"},
    {R"({"x":"\u0000"})", readText, "x"},
    {R"({"x":"a\n"})", readSecret, ""},
    {R"({"x":"a\u0000"})", readSecret, "x"},
    {R"({})", readOptional, ""},
    {R"({"x":""})", readOptional, ""},
    {R"({"x":false})", readOptional, "x"},
    {R"({"x":"abcde"})", readOptional, "x"},
    {R"({})", readTexts, ""},
    {R"({"x":["a","b"]})", readTexts, ""},
    {R"({"x":["a","b","c"]})", readTexts, "x"},
    {R"({"x":[1]})", readTexts, "x"},
    {R"({"x":{"a":"b"}})", readTexts, "x"},
    {R"({"x":"b"})", readWord, ""},
    {R"({"x":"c"})", readWord, "x"},
    {R"({"x":{}})", readWord, "x"},
    {R"({"x":{"addr":"h","protocol":"https","port":1}})", readConn, ""},
    {R"({"x":{"addr":"h","protocol":"https","port":0}})", readConn, "x"},
    {R"({"x":{"addr":"h","protocol":"ftp","port":1}})", readConn, "x"},
    {R"({"x":{"addr":"h","protocol":"https","port":"1"}})", readConn, "x"},
    {R"({"x":{"addr":"h\n","protocol":"https","port":1}})", readConn, "x"},
    {R"({"x":[]})", readConns, "x"},
    {R"({"x":[{}]})", readConns, "x"},
    {R"({"x":[{"addr":"h","protocol":"http","port":1}]})", readConns, ""},
    {R"({"x":[1,2,3]})", readConns, "x"},
    {R"({"x":{"a":1}})", readObject, ""},
    {R"({"x":[]})", readObject, "x"},
    {R"({"x":"abcde"})", readTwo, "y"}};

TEST(Params, takesWhatIsUsableAndNamesWhatIsNot) {
    for (const Scene &scene : kScenes) {
        SCOPED_TRACE(scene.params);
        const Json::Value params = parse(scene.params);
        Params in(params);
        scene.read(in);
        const Json::Value named = in.error()["error"]["msg"]["param"];
        EXPECT_EQ(in.ok(), *scene.refused == '\0');
        EXPECT_EQ(in.ok() ? "" : named.asString(), scene.refused);
        EXPECT_EQ(in.ok() ? 106 : in.error()["error"]["code"].asInt(), 106);
    }
}

TEST(FlowError, passesTheCodeAndMessageOn) {
    const OvraDRCore::ErrRecorder flow;
    flow.SetErr(518, "n2");
    EXPECT_EQ(Ovradrd::flowError(flow, 509)["error"], parse(R"({"code":518,"msg":"n2"})"));
    flow.SetErr(0);
    EXPECT_EQ(Ovradrd::flowError(flow, 509)["error"]["code"], 509);
}

TEST(FlowError, doesNotPassOffAnotherNodesRefusalAsItsOwn) {
    const OvraDRCore::ErrRecorder flow;
    for (const int refusal : {105, 119}) {
        flow.SetErr(refusal);
        EXPECT_EQ(Ovradrd::flowError(flow, 509)["error"]["code"], 525);
    }
}

} // namespace
