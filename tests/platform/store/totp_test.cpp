// SPDX-License-Identifier: Apache-2.0
#include <ovraplatform/totp.h>

#include <gtest/gtest.h>

#include <string>

using namespace OvraPlatform;

namespace {

constexpr char kSecret[] = "GEZDGNBVGY3TQOJQGEZDGNBVGY3TQOJQ"; // "12345678901234567890"

TEST(Totp, AgreesWithTheTestVectorsOfRfc6238) {
    // RFC 6238, appendix B, SHA-1; the last six of its eight digits.
    const struct {
        std::time_t time;
        const char *code;
    } rows[] = {{59, "287082"},         {1111111109, "081804"}, {1111111111, "050471"},
                {1234567890, "005924"}, {2000000000, "279037"}, {20000000000, "353130"}};
    for (const auto &row : rows) {
        EXPECT_EQ(matchTotp(kSecret, row.code, row.time), row.time / 30) << row.time;
    }
}

TEST(Totp, TakesOneStepOfDriftEachWayNoStepTwiceAndOnlyCodes) {
    constexpr std::int64_t kStep = 1111111111 / 30; // 1111111109 is in the previous step
    EXPECT_EQ(matchTotp(kSecret, "050471", (kStep - 1) * 30), kStep);
    EXPECT_EQ(matchTotp(kSecret, "050471", (kStep + 2) * 30 - 1), kStep);
    EXPECT_FALSE(matchTotp(kSecret, "050471", (kStep - 1) * 30 - 1));
    EXPECT_FALSE(matchTotp(kSecret, "050471", (kStep + 2) * 30));
    EXPECT_FALSE(matchTotp(kSecret, "050471", kStep * 30, kStep));
    EXPECT_FALSE(matchTotp(kSecret, "081804", kStep * 30, kStep));
    EXPECT_EQ(matchTotp(kSecret, "081804", kStep * 30, kStep - 2), kStep - 1);
    for (const char *code : {"", "28708", "2870820", "94287082", "28708 ", "28708a", "-87082"}) {
        EXPECT_FALSE(matchTotp(kSecret, code, 59)) << code;
    }
    EXPECT_FALSE(matchTotp("not base32!", "287082", 59));
    EXPECT_FALSE(matchTotp("", "287082", 59));
}

TEST(Totp, SecretsAreRandomReadAsPeopleTypeThemAndShownInAUri) {
    const std::string secret = newTotpSecret();
    EXPECT_EQ(secret.size(), 32U);
    EXPECT_NE(secret, newTotpSecret());
    EXPECT_EQ(normalizeTotpSecret(secret), secret);
    EXPECT_EQ(normalizeTotpSecret("gezd gnbv gy3t qojq gezd gnbv gy3t qojq"), kSecret);
    for (const char *text : {"", "GEZDGNBV", "GEZDGNBVGY3TQOJQGEZDGNBVGY3TQOJ!", "otpauth://x"}) {
        EXPECT_EQ(normalizeTotpSecret(text), "") << text;
    }
    EXPECT_EQ(OvraPlatform::totpUri("store 1&x=/y", "ann@example", kSecret),
              "otpauth://totp/store%201%26x%3D%2Fy:ann%40example?secret=" + std::string(kSecret) +
                  "&issuer=store%201%26x%3D%2Fy&algorithm=SHA1&digits=6&period=30");
}

} // namespace
