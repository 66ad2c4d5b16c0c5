// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "platform/store/raw_sqlite.h"

#include <ovraplatform/account_store.h>

#include <sodium.h>

#include <array>
#include <ctime>
#include <string>
#include <vector>

using namespace OvraPlatform;
using namespace std::string_view_literals;
using OvraTest::RawSqlite;

namespace {

constexpr char kPassword[] = "correct horse";
constexpr char kSecret[] = "GEZDGNBVGY3TQOJQGEZDGNBVGY3TQOJQ"; // of RFC 6238, appendix B
constexpr std::time_t kCodeTime = 1111111111;
constexpr char kCode[] = "050471";        // of kCodeTime
constexpr char kEarlierCode[] = "081804"; // of the step before

/// Of kPassword, at the least cost that there is.
std::string cheapHash() {
    std::array<char, crypto_pwhash_STRBYTES> hash{};
    EXPECT_EQ(crypto_pwhash_str(hash.data(), kPassword, sizeof kPassword - 1,
                                crypto_pwhash_OPSLIMIT_MIN, crypto_pwhash_MEMLIMIT_MIN),
              0);
    return hash.data();
}

struct Accounts : OvraTest::OwnFiles {
    std::string file() const { return path("state/accounts.db"); }
    AccountStore store() {
        return AccountStore(file(), [this] { return time; });
    }
    int verify(const std::string &name, const std::string &password, const std::string &code = "") {
        return static_cast<int>(store().verify(name, password, code));
    }

    std::time_t time = kCodeTime;
};

TEST_F(Accounts, LogInAsTheirStateAllows) {
    for (const char *name : {"plain", "disabled", "local", "coded", "disabledCoded"}) {
        ASSERT_TRUE(store().add(name, kPassword, Role::kUser)) << store().error();
    }
    ASSERT_TRUE(store().setDisabled("disabled", true) && store().setRemoteLogin("local", false) &&
                store().setTotp("coded", kSecret) && store().setTotp("disabledCoded", kSecret) &&
                store().setDisabled("disabledCoded", true));
    const struct {
        const char *name;
        const char *password;
        const char *code;
        int result;
    } rows[] = {
        {"plain", kPassword, "", 0},         {"plain", kPassword, "123456", 0}, // not asked for
        {"plain", "correct horsf", "", 400}, {"plain", "", "", 400},
        {"Plain", kPassword, "", 400},       {"plain ", kPassword, "", 400},
        {"nobody", kPassword, "", 400},      {"' OR 1=1 --", kPassword, "", 400},
        {"disabled", kPassword, "", 401},    {"disabled", "wrong", "", 400},
        {"local", kPassword, "", 402},       {"local", "wrong", "", 400},
        {"coded", kPassword, "", 403},       {"coded", kPassword, "000000", 404},
        {"coded", kPassword, "50471", 404},  {"coded", "wrong", "", 400},
        {"coded", "wrong", kCode, 400},      {"disabledCoded", kPassword, kCode, 401},
        {"coded", kPassword, kCode, 0},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(verify(row.name, row.password, row.code), row.result)
            << row.name << " " << row.password << " " << row.code;
    }
    EXPECT_EQ(verify("plain", kPassword + std::string(2000, 'x')), 400);
}

TEST_F(Accounts, ACodeIsAcceptedOnceAndNoEarlierOneAfterIt) {
    ASSERT_TRUE(store().add("ann", kPassword, Role::kUser) && store().setTotp("ann", kSecret));
    EXPECT_EQ(verify("ann", kPassword, kCode), 0);
    EXPECT_EQ(verify("ann", kPassword, kCode), 404);
    EXPECT_EQ(verify("ann", kPassword, kEarlierCode), 404);
    ASSERT_TRUE(store().setPassword("ann", "another horse"));
    EXPECT_EQ(verify("ann", "another horse", kCode), 404);
    ASSERT_TRUE(store().clearTotp("ann"));
    EXPECT_EQ(verify("ann", "another horse"), 0);
    ASSERT_TRUE(store().setTotp("ann", kSecret));
    EXPECT_EQ(verify("ann", "another horse", kEarlierCode), 0);
}

TEST_F(Accounts, OfTwoLogInsAtOnceWithTheSameCodeOneIsLetIn) {
    ASSERT_TRUE(store().add("ann", kPassword, Role::kUser) && store().setTotp("ann", kSecret));
    // The store reads the clock after it has read the account and before it checks the code.
    int meanwhile = -1;
    AccountStore slower(file(), [&] {
        meanwhile = verify("ann", kPassword, kCode);
        return time;
    });
    EXPECT_EQ(slower.verify("ann", kPassword, kCode), LoginResult::kCodeWrong);
    EXPECT_EQ(meanwhile, 0);
}

TEST_F(Accounts, AreListedByName) {
    ASSERT_TRUE(store().add("bob", kPassword, Role::kUser) &&
                store().add("ann", kPassword, Role::kAdministrator));
    ASSERT_TRUE(store().setTotp("ann", "gezd gnbv gy3t qojq gezd gnbv gy3t qojq"));
    std::vector<Account> accounts;
    ASSERT_TRUE(store().list(accounts));
    ASSERT_EQ(accounts.size(), 2U);
    EXPECT_EQ(accounts[0].name, "ann");
    EXPECT_TRUE(accounts[0].isAdministrator() && accounts[0].oneTimeCode &&
                accounts[0].remoteLogin);
    EXPECT_FALSE(accounts[0].disabled || accounts[1].isAdministrator() || accounts[1].oneTimeCode);
    EXPECT_EQ(accounts[0].created, time);
    ASSERT_TRUE(store().remove("ann"));
    EXPECT_FALSE(store().exists("ann"));
    EXPECT_TRUE(store().exists("bob"));
}

TEST_F(Accounts, WhatCannotBeDoneIsRefusedWithAReason) {
    AccountStore accounts = store();
    ASSERT_TRUE(accounts.add("ann", kPassword, Role::kUser));
    const auto reason = [&](bool done) { return done ? std::string("done") : accounts.error(); };
    EXPECT_EQ(reason(accounts.add("ann", "other password", Role::kUser)),
              "There is an account [ann] already.");
    EXPECT_EQ(reason(accounts.setDisabled("bob", true)), "There is no account [bob].");
    EXPECT_NE(reason(accounts.setPassword("ann", "short")).find("8 to 1024"), std::string::npos);
    for (const std::string &password :
         {std::string("correct h\xf6rse"), std::string("correct \0horse", 14)}) {
        EXPECT_NE(reason(accounts.setPassword("ann", password)).find("UTF-8"), std::string::npos);
    }
    EXPECT_NE(reason(accounts.setTotp("ann", "GEZDGNBV")).find("base32"), std::string::npos);
    EXPECT_EQ(verify("ann", kPassword), 0);
    EXPECT_FALSE(accounts.find("ann")->isAdministrator());
}

TEST(AccountNames, AreOfASafeSet) {
    for (const char *name : {"a", "ann.b-c_d@example", "0", "_system"}) {
        EXPECT_TRUE(AccountStore::isName(name)) << name;
    }
    for (const auto name : {""sv, "-a"sv, ".a"sv, "@a"sv, "a b"sv, "a/b"sv, "a\nb"sv, "a\0b"sv,
                            "\xC3\xA4"sv, "a'b"sv}) {
        EXPECT_FALSE(AccountStore::isName(name)) << name;
    }
    EXPECT_TRUE(AccountStore::isName(std::string(64, 'a')));
    EXPECT_FALSE(AccountStore::isName(std::string(65, 'a')));
}

TEST_F(Accounts, AHashOfAnotherCostIsRenewedAtTheNextLogIn) {
    ASSERT_TRUE(store().add("ann", kPassword, Role::kUser));
    const std::string cheap = cheapHash();
    RawSqlite raw(file());
    ASSERT_TRUE(raw.run("UPDATE account SET hash = '" + cheap + "'"));
    EXPECT_EQ(verify("ann", "wrong password"), 400);
    EXPECT_EQ(raw.cell("SELECT hash FROM account"), cheap);
    EXPECT_EQ(verify("ann", kPassword), 0);
    EXPECT_EQ(raw.cell("SELECT hash FROM account").substr(0, 26), "$argon2id$v=19$m=65536,t=2");
    EXPECT_EQ(verify("ann", kPassword), 0);
}

TEST_F(Accounts, ADamagedStoreLetsNobodyIn) {
    OvraTest::writeFile(file(), std::string(8192, 'x'));
    chmod(path("state").c_str(), 0700);
    EXPECT_EQ(verify("ann", kPassword), static_cast<int>(LoginResult::kStoreFailed));
    EXPECT_FALSE(store().exists("ann"));
    EXPECT_FALSE(store().add("ann", kPassword, Role::kAdministrator));
}

} // namespace
