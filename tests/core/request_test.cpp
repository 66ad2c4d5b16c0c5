// SPDX-License-Identifier: Apache-2.0
#include <ovradrcore/json.h>
#include <ovradrcore/request.h>
#include <ovradrcore/response.h>

#include <gtest/gtest.h>

#include <thread>

using namespace OvraDRCore;

namespace {

Json::Value json(const std::string &text) {
    Json::Value value;
    EXPECT_TRUE(fromString(value, text)) << text;
    return value;
}

} // namespace

TEST(Request, SurvivesItsJsonForm) {
    Request request("OVRA.DR.Node", 2, "info", Json::Value());
    request.addParam("k", 1);
    request.addParam("k", "b");
    request.addParam(json(R"({"addr":"h","port":5})"));
    request.addParam(Json::Value("not an object"));
    request.setEncryptRequired(true);
    const Request again(request.toJson());
    EXPECT_TRUE(again.isValid());
    EXPECT_TRUE(again.isEncryptRequired());
    EXPECT_EQ(again.toStr(), request.toStr());
    EXPECT_EQ(again.getParams(), json(R"({"k":"b","addr":"h","port":5})"));
}

TEST(Request, IncompleteOrForeignJsonIsInvalidAndNeverThrows) {
    EXPECT_FALSE(Request().isValid());
    EXPECT_TRUE(Request(json(R"({"api":"a","method":"m","version":1})")).isValid())
        << "absent parameters count as none";
    for (const char *text :
         {"null", "[]", "\"a\"", "{}", R"({"api":"a","method":"m"})",
          R"({"api":"","method":"m","version":1})", R"({"api":"a","method":3,"version":1})",
          R"({"api":"a","method":"m","version":"1"})", R"({"api":"a","method":"m","version":0})",
          R"({"api":"a","method":"m","version":9999999999})",
          R"({"api":"a","method":"m","version":1,"params":[]})",
          R"({"api":"a\u0000","method":"m","version":1})",
          R"({"api":"a","method":"m\u0000","version":1})",
          R"({"api":"a","method":"m","version":1,"encrypt":"yes"})"}) {
        EXPECT_FALSE(Request(json(text)).isValid()) << text;
    }
    Request request("a", 1, "m", Json::Value());
    for (const auto &[seconds, valid] :
         {std::pair(0L, false), {1, true}, {86400, true}, {86401, false}, {-1, false}}) {
        request.setResponseTimeout(seconds);
        EXPECT_EQ(request.isValid(), valid) << seconds;
    }
}

TEST(Response, UnderstandsTheTwoWireForms) {
    Response response(json(R"({"success":true,"data":{"s":"x","n":5,"b":true,"o":{}}})"));
    EXPECT_TRUE(response.isValid() && response.isSuccess());
    EXPECT_EQ(response.getErrCode(), 0);
    for (const auto &[field, text] :
         {std::pair("s", "x"), {"n", "5"}, {"b", "true"}, {"o", ""}, {"absent", ""}}) {
        EXPECT_EQ(response.getDataFieldtoStr(field), text) << field;
    }
    EXPECT_TRUE(response.getDataField("absent").isNull());
    response.setResp(std::string(R"({"success":false,"error":{"code":105,"msg":["a"]}})"));
    EXPECT_TRUE(response.isValid());
    EXPECT_FALSE(response.isSuccess() || response.hasDataField("s"));
    EXPECT_EQ(response.getErrCode(), 105);
    EXPECT_EQ(Response(response.toJson()).toJson(), response.toJson());
    EXPECT_TRUE(Response(json(R"({"success":true})")).isSuccess()) << "no data is no failure";
}

TEST(Response, AnythingElseIsInvalidWithANonZeroCode) {
    for (const std::string reply :
         {"", "<html>busy</html>", R"({"success":true} trailing)", "null", "[]", "true", "{}",
          R"({"success":"true"})", R"({"success":true,"data":[1]})", R"({"success":false})",
          R"({"success":false,"error":{"code":0}})", R"({"success":false,"error":{"code":"105"}})",
          R"({"success":false,"error":105})",
          R"({"success":false,"error":{"code":99999999999}})"}) {
        Response response(json(R"({"success":true,"data":{"old":1}})"));
        response.setResp(reply);
        EXPECT_FALSE(response.isValid() || response.isSuccess()) << reply;
        EXPECT_EQ(response.getErrCode(), 407) << reply;
        EXPECT_FALSE(response.hasDataField("old")) << reply;
    }
}

TEST(Response, AReplyThatWasReadAlreadyIsHandedOverToWhoeverHasItsTextAndWaits) {
    const std::string text = R"({"success":true,"data":{"a":1}})";
    // Differs from the text, to show where a reply came from.
    const auto give = [&text] { ReplyHandOver::give(text, Response(json(R"({"success":true})"))); };
    const auto wasHandedOver = [&text] {
        Response response;
        response.setResp(text);
        return response.isSuccess() && !response.hasDataField("a");
    };
    give();
    EXPECT_FALSE(wasHandedOver()) << "nobody waited";
    {
        const ReplyHandOver outer;
        EXPECT_FALSE(wasHandedOver()) << "nothing was given";
        give();
        {
            const ReplyHandOver inner;
            EXPECT_FALSE(wasHandedOver()) << "given to another";
        }
        std::thread([&] {
            give();
            EXPECT_FALSE(wasHandedOver()) << "on another thread";
        }).join();
        Response other;
        other.setResp(text + " ");
        EXPECT_TRUE(other.hasDataField("a")) << "another text";
        EXPECT_TRUE(wasHandedOver());
        EXPECT_FALSE(wasHandedOver()) << "once";
        give();
    }
    const ReplyHandOver next;
    EXPECT_FALSE(wasHandedOver()) << "given before it waited";
}
