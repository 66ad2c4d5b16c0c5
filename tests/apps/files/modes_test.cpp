// SPDX-License-Identifier: Apache-2.0
#include "scene.h"

#include <gtest/gtest.h>

#include <map>

namespace OvradrTest {

namespace {

/// Path and mode of all that an appliance makes under this umask.
std::map<std::string, unsigned int> madeUnder(mode_t mask) {
    startAnew();
    OvraTest::OtherProcess maker([mask] {
        umask(mask);
        const bool made =
            run({"setup", "--serial", "A1"}).exit == 0 &&
            run({"user", "add", "ann", "--admin", "--password-stdin"}, "correct horse").exit == 0 &&
            run({"session", "pending"}).exit == 0 && run({"user", "list"}).exit == 0;
        return made && useDaemon().find("ready") != std::string::npos ? useLibrary() : 1;
    });
    EXPECT_EQ(maker.wait(), 0) << std::oct << mask;
    std::map<std::string, unsigned int> modes;
    for (const char *folder : kOwnFolders) {
        modes[folder] = modeOf(folder);
        for (const auto &entry : fs::recursive_directory_iterator(folder)) {
            if (!entry.is_symlink()) {
                modes[entry.path()] = modeOf(entry.path());
            }
        }
    }
    return modes;
}

} // namespace

TEST(ModesOfAllThatIsMade, DoNotDependOnTheUmask) {
    const auto usual = madeUnder(022);
    EXPECT_GT(usual.size(), 20U);
    for (const auto &[path, mode] : usual) {
        EXPECT_TRUE((mode & 022U) == 0 || mode == 01777U) << path << std::oct << ' ' << mode;
    }
    const std::string config = "/usr/ovra/etc/ovradr";
    for (const std::string &open : {std::string("/usr/ovra/ovradr/sbin"), config}) {
        EXPECT_EQ(usual.at(open), 0755U) << open;
    }
    for (const std::string &closed :
         {std::string("/tmp/.ovradrcache"), std::string("/usr/ovra/var/ovradr")}) {
        EXPECT_EQ(usual.at(closed), 0700U) << closed;
    }
    for (const char *secret : {"/node.db", "/ovradrd.key", "/ovradrd.seal"}) {
        EXPECT_EQ(usual.at(config + secret), 0600U) << secret;
    }
    for (const mode_t mask : {0U, 077U, 0777U}) {
        EXPECT_EQ(madeUnder(mask), usual) << std::oct << mask;
    }
}

TEST(Doctor, LooksAtEveryFolderOnTheWayToWhatRootRunsAndReads) {
    ASSERT_EQ(run({"setup"}).exit, 0);
    const auto examined = [] { return run({"doctor"}).out; };
    EXPECT_EQ(examined().find("Root relies on"), std::string::npos) << examined();
    for (const std::string path :
         {"/usr/ovra/ovradr/sbin", "/usr/ovra/ovradr", "/usr/ovra", "/usr/ovra/etc/ovradr/node.db",
          "/usr/ovra/etc/ovradr/ovradrd.conf"}) {
        writeFile("/usr/ovra/etc/ovradr/ovradrd.conf", "");
        const mode_t mode = modeOf(path);
        chmod(path.c_str(), mode | 02U);
        EXPECT_NE(examined().find("others may write to " + path), std::string::npos) << path;
        chmod(path.c_str(), mode);
        if (chown(path.c_str(), 65534, 0) == 0) { // only the superuser can
            EXPECT_NE(examined().find(path + " belongs to user 65534"), std::string::npos) << path;
            ASSERT_EQ(chown(path.c_str(), geteuid(), 0), 0);
        }
    }
}

} // namespace OvradrTest
