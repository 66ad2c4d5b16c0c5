// SPDX-License-Identifier: Apache-2.0
#include <ovrabase/number.h>
#include <ovrabase/secret.h>
#include <ovrabase/utf8.h>

#include <gtest/gtest.h>

#include <cstdint>
#include <string>

using namespace OvraBase;

TEST(Number, IsTheWholeTextOrNothing) {
    EXPECT_EQ(parseNumber<int>("42"), 42);
    EXPECT_EQ(parseNumber<int>("-42"), -42);
    EXPECT_EQ(parseNumber<std::uint64_t>("18446744073709551615"), UINT64_MAX);
    for (const char *text : {"", "x", "42x", " 42", "42 ", "+42", "0x10", "4.2", "99999999999"}) {
        EXPECT_FALSE(parseNumber<int>(text)) << text;
    }
    EXPECT_FALSE(parseNumber<unsigned int>("-1"));
    EXPECT_EQ(parsePort("1"), 1);
    EXPECT_EQ(parsePort("65535"), 65535);
    for (const char *text : {"0", "65536", "-1", "5443x", ""}) {
        EXPECT_FALSE(parsePort(text)) << text;
    }
}

TEST(Utf8, IsTheShortestFormOfACharacterThatThereIs) {
    for (const char *text :
         {"", "az~", "\u0080\u07ff", "\u0800\ud7ff\ue000\uffff", "\U00010000\U0010ffff"}) {
        EXPECT_TRUE(isUtf8(text)) << text;
    }
    for (const char *text : {"a\x80", "\xbf", "\xc1\xbf", "\xc3", "\xc3z", "\xe0\x9f\xbf",
                             "\xe2\x82", "\xed\xa0\x80", "\xed\xbf\xbf", "\xf0\x8f\xbf\xbf",
                             "\xf0\x9f\x98", "\xf4\x90\x80\x80", "\xf8\x88\x80\x80\x80", "\xff"}) {
        EXPECT_FALSE(isUtf8(text)) << text;
    }
    EXPECT_EQ(firstUtf8("\U0001f600x").code, U'\U0001f600');
}

TEST(Secret, NeverMovesWhileItIsTypedIn) {
    Secret secret;
    const char *const where = secret.get().data();
    for (std::size_t i = 0; i < Secret::kMaxSize; ++i) {
        ASSERT_TRUE(secret.append('x'));
    }
    EXPECT_FALSE(secret.append('x'));
    EXPECT_EQ(secret.get().data(), where);
    secret.removeLast();
    EXPECT_EQ(secret.get(), std::string(Secret::kMaxSize - 1, 'x'));
}

TEST(Secret, LeavesNothingWhereItLay) {
    const std::string typed = "a password that is longer than a short string";
    std::string text = typed;
    { const WipeAtEnd wiped(text); }
    EXPECT_TRUE(text.empty());
    EXPECT_EQ(std::string(text.data(), typed.size()), std::string(typed.size(), '\0'));
    text = typed;
    EXPECT_EQ(Secret::take(text).get(), typed);
    EXPECT_EQ(text, "");
}
