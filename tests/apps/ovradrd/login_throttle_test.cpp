// SPDX-License-Identifier: Apache-2.0
#include "login_throttle.h"
#include "platform/own_files.h"
#include "platform/store/raw_sqlite.h"
#include "support/log_capture.h"

#include <optional>
#include <string>

using Ovradrd::LoginThrottle;
using namespace std::chrono_literals;

namespace {

struct Throttle : OvraTest::OwnFiles {
    void SetUp() override {
        OwnFiles::SetUp();
        restart();
    }
    std::string file() const { return path("state/logins.db"); }
    /// A new one, whose clock shows `time`.
    void restart() { open(file()); }
    void open(const std::string &path) {
        const LoginThrottle::Clock clock{[this] { return elapsed; }, [this] { return time; }};
        throttle.emplace(path, clock);
        throttle->recall();
    }
    void pass(std::chrono::seconds some) {
        elapsed += some;
        time += some.count();
    }
    static LoginThrottle::Login from(const std::string &address, const std::string &device = "",
                                     const std::string &account = "ann") {
        return {account, address, device};
    }
    /// How many of `tries` wrong log-ins at once are admitted.
    int guess(int tries, const LoginThrottle::Login &login) {
        int admitted = 0;
        for (int i = 0; i < tries; ++i) {
            admitted += throttle->admit(login) ? 1 : 0;
        }
        return admitted;
    }
    bool logIn(const LoginThrottle::Login &login) {
        const auto attempt = throttle->admit(login);
        if (attempt) {
            throttle->recordSuccess(login, *attempt);
        }
        return attempt.has_value();
    }
    /// Strangers use up what they may.
    void attack(const std::string &account = "ann") {
        for (int i = 0; i < 30; ++i) {
            guess(20, from("198.51.100." + std::to_string(i), "", account));
        }
    }

    std::chrono::milliseconds elapsed{};
    std::time_t time = 1'800'000'000;
    std::optional<LoginThrottle> throttle;
};

TEST_F(Throttle, Admits100GuessesAnHourAtOneAccountWhoeverGuessesAndHoweverOftenItIsRestarted) {
    ASSERT_TRUE(logIn(from("192.0.2.1")) && logIn(from("192.0.2.2")) && logIn(from("192.0.2.3")));
    int admitted = 0;
    for (int second = 0; second < 2 * 3600; second += 30) {
        if (second % 60 == 0) {
            restart();
        }
        // Known addresses that are shared, a persistent stranger, and strangers of ever new ones.
        for (const std::string &address :
             {std::string("192.0.2.1"), std::string("192.0.2.2"), std::string("192.0.2.3"),
              std::string("198.51.100.1"), "10.0." + std::to_string(second / 30) + ".1"}) {
            admitted += guess(2, from(address));
        }
        if (second == 3570) {
            EXPECT_LE(admitted, 100);
            EXPECT_GT(admitted, 90);
        }
        pass(30s);
    }
    EXPECT_LE(admitted, 40 + 2 * 60); // the bursts, then a guess a minute
}

TEST_F(Throttle, KeepsNobodyOutWhoLoggedInBeforeNorAStrangerForAnothersGuesses) {
    ASSERT_TRUE(logIn(from("192.0.2.1", "device")) && logIn(from("", "relayed")));
    ASSERT_TRUE(logIn(from("2001:db8:0:7::1")));
    EXPECT_TRUE(throttle->knows(from("192.0.2.1")) && throttle->knows(from("", "relayed")));
    EXPECT_EQ(guess(1000, from("198.51.100.1")), 10);
    EXPECT_EQ(guess(1, from("198.51.100.2")), 1) << "one stranger took all";
    attack();
    restart();
    EXPECT_TRUE(throttle->knows(from("203.0.113.2", "device")) &&
                throttle->knows(from("192.0.2.1")));
    EXPECT_FALSE(throttle->knows(from("198.51.100.1")) || throttle->knows(from("")));
    const struct {
        const char *who;
        LoginThrottle::Login login;
        bool admitted;
    } rows[] = {
        {"the address", from("192.0.2.1"), true},
        {"its network", from("2001:db8:0:7:ffff::2"), true},
        {"the device elsewhere", from("203.0.113.2", "device"), true},
        {"the device through the relay", from("", "device"), true},
        {"the device that came through the relay", from("203.0.113.2", "relayed"), true},
        {"somebody else through the relay", from(""), false},
        {"another device", from("203.0.113.2", "another"), false},
        {"another network", from("2001:db8:0:8::1"), false},
        {"another account", from("203.0.113.3", "", "bob"), true},
        {"the device at another account", from("198.51.100.1", "device", "bob"), true},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(guess(1, row.login), row.admitted) << row.who;
    }
    const auto refused = throttle->admit(from("203.0.113.2"));
    ASSERT_FALSE(refused);
    EXPECT_EQ(refused.error(), 120s);
    pass(120s);
    EXPECT_EQ(guess(5, from("203.0.113.2")), 1);
}

TEST_F(Throttle, CountsNoLogInThatIsRightOrCannotBeJudged) {
    for (int i = 0; i < 100; ++i) {
        ASSERT_TRUE(logIn(from("192.0.2.1"))) << i;
        throttle->withdraw(throttle->admit(from("192.0.2.2")).value());
    }
    // Nor does one's own account pay for guesses at others.
    for (int i = 0; i < 100; ++i) {
        guess(1, from("192.0.2.1", "", "user" + std::to_string(i)));
        logIn(from("192.0.2.1"));
    }
    EXPECT_EQ(guess(1, from("192.0.2.1", "", "bob")), 0);
}

TEST_F(Throttle, ForgetsAnAddressAfter90DaysAndTheOldestOfManyClients) {
    ASSERT_TRUE(logIn(from("192.0.2.1", "device")));
    pass(std::chrono::hours(24 * 89));
    attack();
    EXPECT_EQ(guess(1, from("192.0.2.1")), 1);
    pass(25h);
    attack();
    EXPECT_EQ(guess(1, from("192.0.2.1")), 0);
    EXPECT_EQ(guess(1, from("203.0.113.1", "device")), 1);
    for (int i = 0; i < LoginThrottle::kMaxKnown; ++i) {
        pass(121s);
        ASSERT_TRUE(logIn(from("", "device" + std::to_string(i)))) << i;
    }
    attack();
    EXPECT_EQ(guess(1, from("", "device0")), 1);
    EXPECT_EQ(guess(1, from("203.0.113.1", "device")), 0);
}

TEST_F(Throttle, IsLedAstrayByNoClock) {
    constexpr std::time_t kYear = 365L * 24 * 3600;
    ASSERT_TRUE(logIn(from("", "device")));
    for (const std::time_t jump : {-kYear, 2 * kYear, -kYear}) {
        attack();
        time += jump; // while it runs
        EXPECT_EQ(guess(10, from("203.0.113.1")), 0) << jump;
        restart();
        EXPECT_EQ(guess(100, from("203.0.113.1")), jump > 0 ? 10 : 0) << jump; // one burst
        attack();
        pass(121s);
        EXPECT_EQ(guess(3, from("203.0.113.2")), 1) << jump;
        EXPECT_TRUE(logIn(from("", "device"))) << jump;
        pass(1h);
    }
}

TEST_F(Throttle, StaysSmallUnderAFloodOfNamesAndForgetsNoAccountThatIsGuessed) {
    attack();
    OvraTest::RawSqlite raw(file());
    ASSERT_TRUE(raw.run("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < "
                        "50000) INSERT INTO budget SELECT randomblob(16), " +
                        std::to_string(time * 1000 + 180'000) + " FROM n"));
    EXPECT_EQ(guess(1, from("203.0.113.1", "", "bob")), 1);
    EXPECT_EQ(raw.cell("SELECT count(*) FROM budget"), std::to_string(LoginThrottle::kMaxBudgets));
    EXPECT_EQ(guess(1, from("203.0.113.1")), 0);
    pass(180s);
    EXPECT_EQ(guess(1, from("203.0.113.1", "", "bob")), 1);
    EXPECT_LT(raw.cell("SELECT count(*) FROM budget").size(), 3U);
}

TEST_F(Throttle, CountsInMemoryWhileItsFileCannotBeUsedAndSaysSoOnce) {
    OvraTest::writeFile(file(), std::string(8192, 'x'));
    chmod(path("state").c_str(), 0700);
    const LogCapture log;
    EXPECT_EQ(guess(100, from("198.51.100.1")), 10);
    EXPECT_EQ(log.count("counted in memory"), 1);
    std::filesystem::remove(file());
    pass(10min);
    ASSERT_TRUE(logIn(from("192.0.2.1")));
    EXPECT_EQ(OvraTest::RawSqlite(file()).cell("SELECT count(*) FROM known"), "1");
    EXPECT_EQ(OvraTest::modeOf(file()), 0600U);
    EXPECT_EQ(log.count("ERR"), 2); // what is wrong with the file, and what follows
}

} // namespace
