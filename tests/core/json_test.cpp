// SPDX-License-Identifier: Apache-2.0
#include <ovradrcore/json.h>
#include <ovradrcore/util.h>

#include <gtest/gtest.h>

#include <climits>
#include <limits>
#include <locale>

using namespace OvraDRCore;
using std::string_literals::operator""s;

namespace {

std::string nested(int levels, const std::string &open, const std::string &close) {
    std::string text;
    for (int i = 0; i < 2 * levels; ++i) {
        text += i < levels ? open : close;
    }
    return text;
}

} // namespace

TEST(JsonText, IsReadExactlyAndWrittenCompactly) {
    const struct {
        std::string read, written;
    } cases[] = {
        {" \t\r\n[ ] ", "[]"},
        {R"( { "b" : [ 1 , null ] , "a" : { } } )", R"({"a":{},"b":[1,null]})"},
        {"[-0,-9223372036854775808,18446744073709551615]",
         "[0,-9223372036854775808,18446744073709551615]"},
        {"[0.1,5e0,-1E+2,1.5e-7,18446744073709551616]",
         "[0.1,5.0,-100.0,1.5e-07,18446744073709551616.0]"},
        {"[1e-400,-1E-99999999999,0." + std::string(400, '0') + "1e+50,5e-324]",
         "[0.0,-0.0,0.0,5e-324]"},
        {R"("\"\\\/\b\f\n\r\t\u0000\u001F\u007f")",
         "\"\\\"\\\\/\\b\\f\\n\\r\\t\\u0000\\u001f\\u007f\""},
        {"\"\u00e4\u20ac\U0001f600\"", R"("\u00e4\u20ac\ud83d\ude00")"},
        {R"({"\u00E4\u20aC\uD83D\uDE00\u0000":1})", R"({"\u00e4\u20ac\ud83d\ude00\u0000":1})"},
        {nested(200, "[", "]"), nested(200, "[", "]")},
    };
    for (const auto &each : cases) {
        Json::Value value;
        Json::Value again;
        ASSERT_TRUE(fromString(value, each.read)) << each.read;
        EXPECT_EQ(toString(value), each.written);
        EXPECT_TRUE(fromString(again, each.written)) << each.written;
        EXPECT_EQ(again, value);
    }
    EXPECT_EQ(toString("a\xff\xed\xa0\x80z"), R"("a\ufffd\ufffd\ufffd\ufffdz")");
    EXPECT_EQ(toString(std::numeric_limits<double>::infinity()), "null");
}

TEST(JsonText, OfAnyOtherFormIsRefusedAndLeavesTheValue) {
    for (const std::string &text :
         {""s, " "s, "nul"s, "True"s, "[1"s, "[1,]"s, "[,1]"s, "[1 2]"s, "[1]]"s, "[1] x"s, "1\0"s,
          "{\"a\"}"s, "{\"a\":}"s, "{\"a\":1,}"s, "{a:1}"s, "{\"a\":1 \"b\":2}"s, "{'a':1}"s,
          "{\"a\":1,\"\\u0061\":2}"s, "[1}"s, "/**/1"s,
          "\xef\xbb\xbf"
          "1"s,
          // numbers
          "01"s, "-"s, "-01"s, "+1"s, "1."s, ".5"s, "1.e2"s, "1e"s, "1e+"s, "0x1"s, "1,5"s, "NaN"s,
          "Infinity"s, "1e400"s, "-1e400"s, "1e99999999999"s, "1" + std::string(400, '0') + "e-50",
          // strings
          "\"a"s, "\"\n\""s, "\"\t\""s, "\"\x1f\""s, "\"\0\""s, "\"\\x\""s, "\"\\u12\""s,
          "\"\\u12g4\""s, "\"\\u-123\""s, "\"\\ud800\""s, "\"\\ud800\\u0041\""s, "\"\\udc00\""s,
          "\"\\"s,
          // not UTF-8
          "\"\x80\""s, "\"\xc0\xaf\""s, "\"\xc3\""s, "\"\xe0\x9f\xbf\""s, "\"\xed\xa0\x80\""s,
          "\"\xf4\x90\x80\x80\""s, "\"\xf8\x88\x80\x80\x80\""s,
          // too deep
          nested(201, "[", "]"), nested(201, "{\"a\":", "}"), std::string(1000000, '[')}) {
        Json::Value value("old");
        EXPECT_FALSE(fromString(value, text)) << text.substr(0, 40);
        EXPECT_EQ(value, Json::Value("old")) << text.substr(0, 40);
    }
}

TEST(JsonText, IsReadWithinItsLimitsOnly) {
    const auto times = [](int count, const std::string &item) {
        std::string text;
        for (int i = 0; i < count; ++i) {
            text += (i == 0 ? "" : ",") + item;
        }
        return "[" + text + "]";
    };
    const std::string credential =
        R"({"cred_id":"6f2c0000-0000-4000-8000-000000000000","addr":"2001:db8::1","port":5001,)"
        R"("node_id":"6f2c0000-0000-4000-8000-000000000000","protocol":"https","temporary":false,)"
        R"("session_reference":"0123456789abcdef"})";
    const struct {
        std::string text;
        JsonLimits limits;
        JsonFault fault;
    } cases[] = {
        {times(10'000, credential), {}, JsonFault::kNone},
        {"\"" + std::string(8 << 20, 'x') + "\"", {}, JsonFault::kNone},
        {times(4'000'000, "0"), {}, JsonFault::kTooManyValues},
        {times(2, "[[0]]"), {.depth = 3, .values = 7, .memory = 7 * 96 + 5 * 64}, JsonFault::kNone},
        {times(2, "[[0]]"), {.depth = 2}, JsonFault::kTooDeep},
        {times(2, "[[0]]"), {.values = 6}, JsonFault::kTooManyValues},
        {times(2, "[[0]]"), {.memory = 7 * 96 + 5 * 64 - 1}, JsonFault::kTooMuchMemory},
        {R"("12345678901234567890")", {.memory = 96 + 47}, JsonFault::kTooMuchMemory},
        {R"({"a":"\n"})", {.memory = 2 * 96 + 64 + 63}, JsonFault::kTooMuchMemory},
    };
    for (const auto &each : cases) {
        Json::Value value("old");
        EXPECT_EQ(parseJson(value, each.text, each.limits), each.fault) << each.text.substr(0, 40);
        EXPECT_EQ(value == Json::Value("old"), each.fault != JsonFault::kNone);
    }
    JsonLimits left;
    Json::Value value;
    EXPECT_EQ(parseJson(value, "[1,2]", left, &left), JsonFault::kNone);
    EXPECT_EQ(left.values, JsonLimits().values - 3);
}

TEST(JsonText, AndNumbersAreTheSameInEveryLocale) {
    struct Grouping : std::numpunct<char> {
        char do_decimal_point() const override { return ','; }
        char do_thousands_sep() const override { return '.'; }
        std::string do_grouping() const override { return "\3"; }
    };
    const std::locale before = std::locale::global(std::locale(std::locale(), new Grouping));
    Json::Value value;
    EXPECT_TRUE(fromString(value, "[1234567.5,1234567]"));
    EXPECT_EQ(toString(value), "[1234567.5,1234567]");
    EXPECT_EQ(ToString<int>(INT_MIN), "-2147483648");
    std::locale::global(before);
}

TEST(JsonText, OfALogLineMasksLoginMaterialAtAnyDepthAndNothingElse) {
    Json::Value value;
    for (const char *secret :
         {"password", "passwd", "otpcode", "otp_code", "session", "_sid", "sid", "token",
          "access_token", "sealed", "sealed_reply", "reply_key", "secret", "device_token"}) {
        const std::string open = R"({"l":[{"account":"joe",")"s + secret + "\":";
        ASSERT_TRUE(fromString(value, open + R"(["canary",2,null,{"n":1,"sid":"canary"}]}]})"));
        EXPECT_EQ(toLogString(value), toString(maskSecrets(value)));
        Json::Value masked;
        ASSERT_TRUE(fromString(masked, open + R"(["***","***",null,{"n":1,"sid":"***"}]}]})"));
        EXPECT_EQ(maskSecrets(value), masked);
        EXPECT_NE(toString(value).find("canary"), std::string::npos) << "the text is exact";
    }
}
