// SPDX-License-Identifier: Apache-2.0
#include "failure.h"
#include "output.h"

#include <ovradrcore/err_recorder.h>

#include <gtest/gtest.h>

namespace Ovradr {

TEST(Output, NothingThatATerminalObeysGetsThrough) {
    const struct {
        std::string raw;
        const char *shown;
    } cases[] = {
        {"plain, \xC3\xA4\xE2\x82\xAC\xF0\x9F\x92\xBE",
         "plain, \xC3\xA4\xE2\x82\xAC\xF0\x9F\x92\xBE"},
        {"\x1B[2J\x07", "\\x1b[2J\\x07"},
        {"a\nb\rc\td", "a\\nb\\rc\\td"},
        {std::string("a\0b", 3), "a\\x00b"},
        {"\x7F", "\\x7f"},
        {"\xC2\x9B"
         "31m",
         "\\u009b31m"},                                              // the one-byte form of ESC [
        {std::string("\xE2\x80") + "\xAEgpj.exe", "\\u202egpj.exe"}, // reverses the rest
        {"a\xE2\x80\xA8"
         "b",
         "a\\u2028b"},                                         // a line break
        {"\xFF\xC3(", "\\xff\\xc3("},                          // not UTF-8
        {"\xC0\xAF\xED\xA0\x80", "\\xc0\\xaf\\xed\\xa0\\x80"}, // overlong, surrogate
        {"cut \xE2\x82", "cut \\xe2\\x82"},
    };
    for (const auto &each : cases) {
        EXPECT_EQ(printable(each.raw), each.shown);
    }
}

TEST(Output, ColumnsLineUpWhateverTheCellsHold) {
    EXPECT_EQ(table({"NAME", "ROLE", "LAST"}, {{"bob", "user", "1"},
                                               {"\xC3\xA4", "\xE6\x97\xA5\xE6\x9C\xAC", "2"},
                                               {"x\n", "", ""}}),
              "NAME  ROLE  LAST\n"
              "bob   user  1\n"
              "\xC3\xA4     \xE6\x97\xA5\xE6\x9C\xAC  2\n"
              "x\\n\n");
    EXPECT_EQ(listing({{"node", "1"}, {"nothing", ""}, {"endpoint", "2"}}), "node:      1\n"
                                                                            "endpoint:  2\n");
}

TEST(Output, EveryErrorOfTheLibraryHasItsSentence) {
    for (int code = 1; code < 1000; ++code) {
        const bool known = OvraDRCore::ERR::ToString(code) != "unknown error";
        const Failure found = failureOf(code).value();
        EXPECT_TRUE(!known || found.name.find("error_") == std::string::npos) << code;
        EXPECT_EQ(found.code, code);
        EXPECT_NE(found.exit, ExitCode::kOk) << code;
        EXPECT_TRUE(found.message.ends_with(".") && !found.hint.empty()) << code;
    }
}

TEST(Output, WhatComesWithAnErrorIsToldAndBecomesAdviceWhereItIsSome) {
    Json::Value parameter;
    parameter["param"] = "conns";
    parameter["text"] = "has to be one of: a, b";
    const struct {
        int code;
        Json::Value detail;
        const char *message;
        const char *hint;
    } cases[] = {
        {100, "no daemon on /x: start it",
         "The appliance could not carry out the request (no daemon on /x).", "Start it."},
        {103, "no such method: look", "The API has no such method.", nullptr},
        {106, parameter, "The appliance refused a parameter (conns: has to be one of: a, b).",
         nullptr},
        {401, "conn", "An argument is empty or not valid (conn).", nullptr},
        {524, 7, "The request failed (the reply is too large).", nullptr},
        {9999, Json::Value(), "Error 9999.", nullptr},
    };
    for (const auto &each : cases) {
        const Failure found = failureOf(each.code, each.detail).value();
        EXPECT_EQ(found.message, each.message);
        EXPECT_TRUE(each.hint == nullptr || found.hint == each.hint) << found.hint;
    }
}

TEST(Output, WhatComesWithAnErrorIsToldButNoSecretInIt) {
    Json::Value detail;
    detail["session"] = "s3cret";
    detail["reason"] = "gone";
    const std::string message = failureOf(105, detail).value().message;
    EXPECT_NE(message.find("gone"), std::string::npos) << message;
    EXPECT_EQ(message.find("s3cret"), std::string::npos) << message;
}

} // namespace Ovradr
