// SPDX-License-Identifier: Apache-2.0
// One appliance whose disks have no room, no inodes or no right to write: what it does ends with
// its own error, harms nothing, and works once the disk does.
#include "apps/files/scene.h"
#include "faults/own_view.h"
#include "faults/small_disk.h"

#include <gtest/gtest.h>

namespace OvradrTest {

namespace {

using OvraTest::Disk;
using std::chrono::steady_clock;

const std::pair<const char *, void (*)(const Disk &)> kFaults[] = {
    {"read-only", [](const Disk &disk) { disk.setReadOnly(true); }},
    {"full", [](const Disk &disk) { disk.leavePages(0); }},
    {"no inodes", [](const Disk &disk) { disk.takeInodes(); }},
    {"1 page", [](const Disk &disk) { disk.leavePages(1); }},
    {"2 pages", [](const Disk &disk) { disk.leavePages(2); }},
    {"4 pages", [](const Disk &disk) { disk.leavePages(4); }},
    {"8 pages", [](const Disk &disk) { disk.leavePages(8); }},
};

/// A change, and where it is seen.
const std::pair<Arguments, Arguments> kChanges[] = {
    {{"attr", "set", "local", "app", "name"}, {"attr", "get", "local", "app", "name"}},
    {{"user", "add", "--password-file", "/tmp/password"}, {"user", "list"}},
    {{"conn", "trust", "--fingerprint", "SHA256:" + std::string(43, 'A')}, {"doctor"}},
    {{"setup", "--hostname"}, {"setup"}},
};

} // namespace

TEST(ADiskThatTakesNothing, IsToldAndHarmsNothing) {
    if (!OvraTest::enterView({})) {
        GTEST_SKIP() << "there are no mount namespaces here";
    }
    writeFile("/tmp/password", "correct horse");
    chmod("/tmp/password", 0600);
    ASSERT_EQ(run({"setup", "--serial", "A1"}).exit, 0);
    ASSERT_EQ(run({"user", "list"}).exit + run({"session", "pending"}).exit, 0);
    useLibrary();
    const std::string id = run({"node", "id"}).out;
    const bool all = std::getenv("OVRA_TORTURE") != nullptr;
    int changes = 0;
    std::size_t round = 0;
    steady_clock::duration longest{};
    std::string slowest;
    const auto use = [&](const Arguments &arguments) {
        const auto begin = steady_clock::now();
        const Result result = run(arguments);
        if (const auto took = steady_clock::now() - begin; took > longest) {
            longest = took;
            slowest = arguments.front() + " " + arguments.back();
        }
        EXPECT_TRUE(result.exit >= 0 && (result.exit == 0 || result.out + result.err != ""))
            << arguments.front() << ' ' << arguments.back() << ": " << result.exit;
        return result;
    };
    for (const char *folder : {"/usr/ovra/etc/ovradr", "/usr/ovra/var/ovradr", "/tmp/.ovradrcache",
                               "/run/lock", "/usr/ovra"}) {
        for (const auto &[fault, apply] : kFaults) {
            if (!all && fault == std::string("1 page")) {
                break;
            }
            SCOPED_TRACE(std::string(folder) + ": " + fault);
            const Disk disk(folder);
            apply(disk);
            for (const auto &[change, look] : kChanges) {
                if (!all && &change != &kChanges[round % 4].first) {
                    continue;
                }
                const std::string value = "n" + std::to_string(changes++);
                const std::string name =
                    change[0] == "conn" ? "https://" + value + ".example:5001" : value;
                const Arguments whole = change + Arguments{name};
                const bool done = use(whole).exit == 0;
                const Result seen = use(look);
                EXPECT_TRUE(!done || seen.exit != 0 || change[0] == "conn" ||
                            change[0] == "setup" || seen.out.find(value) != std::string::npos)
                    << change[0] << " was acknowledged\n"
                    << seen.out << seen.err;
                disk.mend();
                if (!done) {
                    const Result again = use(whole);
                    EXPECT_EQ(again.exit, 0) << change[0] << " afterwards: " << again.err;
                }
                apply(disk);
            }
            ++round; // in the short form another change is next
            EXPECT_EQ(OvraTest::OtherProcess(useLibrary).wait(), 0);
            EXPECT_FALSE(useDaemon().empty());
            disk.mend();
            EXPECT_EQ(run({"node", "id"}).out, id);
            const std::string said = useDaemon();
            EXPECT_NE(said.find("ready"), std::string::npos) << said;
        }
    }
    std::cout << changes << " changes, longest: " << slowest << ", "
              << std::chrono::duration_cast<std::chrono::milliseconds>(longest).count() << " ms\n";
    EXPECT_LT(longest, std::chrono::seconds(25));
}

} // namespace OvradrTest
