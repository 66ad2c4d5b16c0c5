// SPDX-License-Identifier: Apache-2.0
#include "support/log_capture.h"

#include <ovrabase/utf8.h>
#include <ovradrcore/err_recorder.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

#include <gtest/gtest.h>

#include <set>

using namespace OvraDRCore;

TEST(Log, LineNamesPlaceLevelAndProcess) {
    LogCapture log;
    OVRA_NOTICE("Set [%s] to [%d]", "a", 7);
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.count("NOTICE", "log_test", "TestBody", "Set [a] to [7]"), 1);
    EXPECT_EQ(log.lines()[0].substr(0, 2), "5 ");
}

TEST(Log, ForeignTextCannotForgeALine) {
    LogCapture log;
    OVRA_ERR("user [%s] %c",
             "x\nnode:1(f)[ERR][1]: forged\x1b[31m\r\t\x7f\u0080\u009f\u00a0\u202e\xff\xc3", '\0');
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(
        log.count("ERR", "log_test", "TestBody",
                  "user [x\\nnode:1(f)[ERR][1]: forged\\x1b[31m\\r\\t\\x7f\\u0080\\u009f\u00a0"
                  "\\u202e\\xff\\xc3] \\x00"),
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

TEST(ErrRecorder, EveryCodeHasANameOfItsOwn) {
    std::set<std::string> names{"unknown error"};
    std::string codes;
    for (int code = -1; code < 1000; ++code) {
        const bool named = names.insert(ERR::ToString(code)).second;
        codes += named ? std::to_string(code) + " " : "";
    }
    EXPECT_EQ(codes,
              "0 401 402 403 404 407 500 501 502 503 504 505 506 507 509 511 512 516 518 519 "
              "520 522 523 524 525 526 527 528 ");
}

TEST(ErrRecorder, RendersCodeAndMessageCopiesAnotherAndRefusesNull) {
    LogCapture log;
    ErrRecorder recorder;
    EXPECT_EQ(toString(recorder.GetErr()), R"({"err_code":0})");
    recorder.SetErr(401, "");
    EXPECT_EQ(toString(recorder.GetErr()), R"({"err_code":401,"err_msg":""})");
    recorder.SetErr(500);
    EXPECT_EQ(toString(recorder.GetErr()), R"({"err_code":500})") << "a later error clears";
    ErrRecorder from;
    from.SetErr(516, "id");
    recorder.SetErr(&from);
    recorder.SetErr(static_cast<const ErrRecorder *>(nullptr));
    EXPECT_EQ(toString(recorder.GetErr()), R"({"err_code":516,"err_msg":"id"})");
    EXPECT_EQ(log.count("ERR", "err_recorder", "SetErr", "Null pointer"), 1);
}
