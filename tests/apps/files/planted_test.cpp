// SPDX-License-Identifier: Apache-2.0
#include "scene.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <chrono>
#include <iostream>

namespace OvradrTest {

namespace {

using std::chrono::steady_clock;

constexpr const char *kCanary = "/tmp/canary";
constexpr const char *kNowhere = "/tmp/nowhere";

/// What somebody may have put in the place of a file.
const std::pair<const char *, std::function<void(const std::string &)>> kPlanted[] = {
    {"link", [](const std::string &path) { fs::create_symlink(kCanary, path); }},
    {"dangling link", [](const std::string &path) { fs::create_symlink(kNowhere, path); }},
    {"FIFO", [](const std::string &path) { EXPECT_EQ(mkfifo(path.c_str(), 0600), 0); }},
    {"folder", [](const std::string &path) { writeFile(path + "/x", "x"); }},
    {"empty file", [](const std::string &path) { writeFile(path, ""); }},
    {"1 TB sparse",
     [](const std::string &path) {
         writeFile(path, "");
         EXPECT_EQ(chmod(path.c_str(), 0600) + truncate(path.c_str(), off_t{1} << 40), 0);
     }},
    {"somebody else's",
     [](const std::string &path) {
         writeFile(path, "x");
         chmod(path.c_str(), 0666);
         static_cast<void>(!chown(path.c_str(), 65534, 65534)); // only the superuser can
     }},
};

/// Every path that something opens by its name.
std::vector<std::string> places() {
    std::vector<std::string> all;
    const auto add = [&all](const std::string &folder, const std::vector<std::string> &names) {
        for (const std::string &name : names) {
            all.push_back(folder + name);
        }
    };
    add("/usr/ovra/etc/ovradr/",
        {"node.info", "node.db", "node.db-journal", "ovradrd.conf", "ovradrd.key", "ovradrd.crt",
         "ovradrd.seal", "farlink.conf", ".lock"});
    add("/usr/ovra/var/ovradr/", {"accounts.db", "sessions.db", "sessions.db-journal",
                                  "releases.db", "logins.db", "device.key", "known_endpoints",
                                  "farlink.key", ".lock", "webapi.sock", "webapi.sock.lock"});
    add("/run/lock/", {"drnode.info.lock"});
    add("/tmp/.ovradrcache", {"", "/dr_node_conn_cache", "/dr_node_conn_cache.lock"});
    return all;
}

/// Plants everything everywhere and uses it. \param use  false if something hung or crashed
void plantEverywhere(const std::function<bool()> &use) {
    startAnew();
    ASSERT_EQ(run({"setup"}).exit, 0);
    ASSERT_EQ(run({"user", "list"}).exit + run({"session", "pending"}).exit, 0);
    fs::remove_all("/tmp/whole");
    fs::copy("/usr/ovra", "/tmp/whole",
             fs::copy_options::recursive | fs::copy_options::copy_symlinks);
    steady_clock::duration longest{};
    for (const std::string &path : places()) {
        for (const auto &[what, plant] : kPlanted) {
            writeFile(kCanary, "canary");
            chmod(kCanary, 0644);
            startAnew();
            fs::copy("/tmp/whole", "/usr/ovra",
                     fs::copy_options::recursive | fs::copy_options::copy_symlinks);
            if (path != "/tmp/.ovradrcache") {
                mkdir("/tmp/.ovradrcache", 0700);
            }
            fs::remove_all(path);
            plant(path);
            const auto begin = steady_clock::now();
            EXPECT_TRUE(use()) << what << " at " << path;
            longest = std::max(longest, steady_clock::now() - begin);
            EXPECT_EQ(readFile(kCanary), "canary") << what << " at " << path;
            EXPECT_EQ(modeOf(kCanary), 0644U) << what << " at " << path;
            EXPECT_FALSE(fs::exists(kNowhere)) << what << " at " << path;
            fs::remove_all(kNowhere);
            fs::remove_all(path);
        }
    }
    std::cout << "longest: "
              << std::chrono::duration_cast<std::chrono::milliseconds>(longest).count() << " ms\n";
    EXPECT_LT(longest, std::chrono::seconds(8)) << "on a busy machine too";
}

} // namespace

TEST(WhatWasPlanted, NeitherHoldsUpNorMisleadsTheLibrary) {
    plantEverywhere([] { return OvraTest::OtherProcess(useLibrary).wait() == 0; });
}

TEST(WhatWasPlanted, NeitherHoldsUpNorMisleadsSetup) {
    plantEverywhere([] { return run({"setup", "--serial", "A1"}).exit >= 0; });
}

TEST(WhatWasPlanted, NeitherHoldsUpNorMisleadsTheDoctor) {
    plantEverywhere([] { return run({"doctor"}).exit >= 0; });
}

TEST(WhatWasPlanted, NeitherHoldsUpNorMisleadsTheDaemon) {
    plantEverywhere([] { return !useDaemon().empty(); });
}

} // namespace OvradrTest
