// SPDX-License-Identifier: Apache-2.0
#include "support/log_capture.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

#include <gtest/gtest.h>
#include <unistd.h>

using namespace OvraDRCore;

TEST(Log, LineNamesPlaceLevelAndProcess) {
    LogCapture log;
    OVRA_NOTICE("Set [%s] to [%d]", "a", 7);
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.count("NOTICE", "log_test", "TestBody", "Set [a] to [7]"), 1);
    EXPECT_EQ(log.lines()[0].substr(0, 2), "5 ");
    EXPECT_NE(log.lines()[0].find("[" + std::to_string(getpid()) + "]"), std::string::npos);
}

TEST(Log, ForeignTextCannotForgeALine) {
    LogCapture log;
    OVRA_ERR("user [%s]", "x\nnode:1(f)[ERR][1]: forged\x1b[31m\r\t\x7f");
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_NE(log.lines()[0].find("x\\nnode:1(f)[ERR][1]: forged\\x1b[31m\\r\\t\\x7f"),
              std::string::npos);
}

TEST(Log, HugeMessageIsCutAndSaysSo) {
    LogCapture log;
    OVRA_ERR("%s", std::string(1000000, 'a').c_str());
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_LT(log.lines()[0].size(), 8000U);
    EXPECT_NE(log.lines()[0].find("more bytes)"), std::string::npos);
}

TEST(Log, LoginMaterialIsMaskedAtAnyDepthAndNothingElse) {
    Json::Value value;
    ASSERT_TRUE(fromString(value, R"({"webapi":{"params":{"password":"p1","otpcode":"123456",
        "account":"joe","conn":{"addr":"h"}}},"session":"s1","list":[{"_sid":"s2"}],"n":1,
        "token":["t1",2,null]})"));
    EXPECT_EQ(
        toLogString(value),
        R"({"list":[{"_sid":"***"}],"n":1,"session":"***","token":["***","***",null],"webapi":{"params":)"
        R"({"account":"joe","conn":{"addr":"h"},"otpcode":"***","password":"***"}}})");
    EXPECT_NE(toString(value).find("p1"), std::string::npos);
}

TEST(ErrRecorder, RendersCodeAndMessage) {
    ErrRecorder recorder;
    EXPECT_EQ(toString(recorder.GetErr()), R"({"err_code":0})");
    recorder.SetErr(401, "");
    EXPECT_EQ(toString(recorder.GetErr()), R"({"err_code":401,"err_msg":""})");
    recorder.SetErr(500);
    EXPECT_EQ(toString(recorder.GetErr()), R"({"err_code":500})") << "a later error clears";
}

TEST(ErrRecorder, CopiesAnotherAndRefusesNull) {
    LogCapture log;
    ErrRecorder from;
    from.SetErr(516, "id");
    ErrRecorder to;
    to.SetErr(&from);
    EXPECT_EQ(to.GetErrCode(), 516);
    EXPECT_EQ(to.GetErrMsg().asString(), "id");
    to.SetErr(static_cast<const ErrRecorder *>(nullptr));
    EXPECT_EQ(to.GetErrCode(), 516);
    EXPECT_EQ(log.count("ERR", "err_recorder", "SetErr", "Null pointer"), 1);
}
