// SPDX-License-Identifier: Apache-2.0
#include "output.h"

#include <gtest/gtest.h>

namespace Ovradr {

TEST(Output, NothingThatATerminalObeysGetsThrough) {
    const std::pair<std::string, const char *> cases[] = {
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
    for (const auto &[raw, shown] : cases) {
        EXPECT_EQ(printable(raw), shown);
    }
    // Every control and format character, and none beside them: RLM, isolates, tags, soft hyphen.
    for (const char *hidden :
         {"\u0085", "\u00ad", "\u061c", "\u200b", "\u200f", "\u202a", "\u2029", "\u2066", "\u2069",
          "\ufeff", "\ufffb", "\U0001d17a", "\U000e0001", "\U000e007f"}) {
        EXPECT_EQ(printable(hidden).substr(0, 2), "\\u");
    }
    for (const char *seen : {"\u00a0", "\u00ae", "\u200a", "\u2010", "\u202f", "\u2070", "~"}) {
        EXPECT_EQ(printable(seen), seen);
    }
    EXPECT_EQ(prettyJson("\x7f\u202e"), "\"\\u007f\\u202e\"\n");
}

TEST(Output, NumbersOfThingsAndTimesReadWell) {
    EXPECT_EQ(counted(1, "session") + ", " + counted(0, "session"), "1 session, 0 sessions");
    EXPECT_EQ(whenText(std::time(nullptr) - 7200), "2 h ago");
    EXPECT_EQ(whenText(std::time(nullptr) + 300000), "in 3 d");
    EXPECT_EQ(tenths(2.6886), 2.7);
    EXPECT_EQ(wrapped("aa \u00e4\u00e4 cc", 6, 1), " aa \u00e4\u00e4\n cc");
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

} // namespace Ovradr
