// SPDX-License-Identifier: Apache-2.0
#include "support/log_capture.h"

#include <ovrabase/utf8.h>
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
    OVRA_ERR("user [%s] %c",
             "x\nnode:1(f)[ERR][1]: forged\x1b[31m\r\t\x7f\u0080\u009f\u00a0\xff\xc3", '\0');
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(
        log.count("ERR", "log_test", "TestBody",
                  "user [x\\nnode:1(f)[ERR][1]: forged\\x1b[31m\\r\\t\\x7f\\u0080\\u009f\u00a0"
                  "\\xff\\xc3] \\x00"),
        1);
}

TEST(Log, HugeMessageIsCutAtACharacterAndSaysSo) {
    for (const std::string unit : {"a", "\n", "\x80", "\xbf", "\u00e4", "\U0001f600"}) {
        std::string text = unit;
        while (text.size() < 1000000) {
            text += text;
        }
        LogCapture log;
        OVRA_ERR("%s", text.c_str());
        ASSERT_EQ(log.lines().size(), 1U);
        const std::string line = log.lines()[0];
        EXPECT_LT(line.size(), 7200U) << unit;
        EXPECT_GT(line.size(), 6900U) << unit;
        EXPECT_NE(line.find("more bytes)"), std::string::npos) << unit;
        EXPECT_TRUE(OvraBase::isUtf8(line)) << unit;
    }
}

TEST(ErrRecorder, NamesEveryCode) {
    std::string names;
    for (int code = -1; code < 1000; ++code) {
        const std::string name = ERR::ToString(code);
        names += name == "unknown error" ? "" : std::to_string(code) + " " + name + "; ";
    }
    EXPECT_EQ(
        names,
        "0 no error; 401 bad parameter; 402 out of memory; 403 no sender; 404 credential not "
        "found; "
        "407 failed; 500 endpoint not connectable; 501 login failed; 502 account disabled; "
        "503 login not permitted; 504 one-time code required; 505 one-time code wrong; "
        "506 credential item refused; 507 unknown node; 509 credential not completed; "
        "511 session not created; 512 session not removed; 516 credential record invalid; "
        "518 belongs to another node; 519 node information not obtained; "
        "520 credential check failed; 522 endpoint chosen by the remote node invalid; "
        "523 login call failed; 524 credential library error; 525 no privilege; "
        "526 certificate not the trusted one; 527 no such user; 528 user of the session unknown; ");
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
