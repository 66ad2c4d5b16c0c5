// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"

#include <ovraplatform/appliance.h>
#include <ovraw3/talo.h>

#include <string>
#include <vector>

using OvraPlatform::ApplianceConfig;
using OvraPlatform::ensureStateDir;
using OvraPlatform::readApplianceConfig;
using OvraTest::modeOf;
using OvraTest::writeFile;

namespace {

using Strings = std::vector<std::string>;

struct Appliance : OvraTest::OwnFiles {
    ApplianceConfig read(const std::string &text) const {
        writeFile(path("conf"), text);
        return readApplianceConfig(path("conf"));
    }
};

TEST_F(Appliance, WithoutAFileItHasDefaults) {
    const ApplianceConfig config = readApplianceConfig(path("absent"));
    EXPECT_EQ(config.httpPort, 5000);
    EXPECT_EQ(config.httpsPort, 5001);
    EXPECT_TRUE(config.servesAllAddresses);
    EXPECT_EQ(config.hostname + config.serial, "");
    EXPECT_TRUE(config.problems.empty());
}

TEST_F(Appliance, ReadsEverySetting) {
    const ApplianceConfig config =
        read("http_port=\"8080\"\nhttps_port=8443\naddress=\"192.0.2.7, 2001:db8::7\"\n"
             "hostname=\"store-1.example\"\nserial=\"AB 12\"\n");
    EXPECT_EQ(config.httpPort, 8080);
    EXPECT_EQ(config.httpsPort, 8443);
    EXPECT_FALSE(config.servesAllAddresses);
    EXPECT_EQ(config.addresses, (Strings{"192.0.2.7", "2001:db8::7"}));
    EXPECT_EQ(config.hostname, "store-1.example");
    EXPECT_EQ(config.serial, "AB 12");
    EXPECT_TRUE(config.problems.empty());
}

TEST_F(Appliance, NamesWhatItCannotUseAndGoesOnWithout) {
    const char *const unusable[] = {"http_port=\"0\"\n",        "http_port=\"65536\"\n",
                                    "https_port=\"80x\"\n",     "https_port=\" 443 443\"\n",
                                    "http_port=\"8080\n",       "hostname=\"two words\"\n",
                                    "hostname=\"../../etc\"\n", "serial=\"a\tb\"\n",
                                    "\x7F\x45\x4C\x46\n",       "http_port=\"99999999999\"\n"};
    for (const char *text : unusable) {
        const ApplianceConfig config = read(text);
        EXPECT_EQ(config.problems.size(), 1U) << text;
        EXPECT_EQ(config.httpPort, 5000) << text;
        EXPECT_EQ(config.httpsPort, 5001) << text;
        EXPECT_EQ(config.hostname + config.serial, "") << text;
    }
}

TEST_F(Appliance, AnUnusableAddressNeverMeansEveryAddress) {
    const ApplianceConfig mixed = read("address=\"192.0.2.300,192.0.2.3,,host,fe80::1\"\n");
    EXPECT_FALSE(mixed.servesAllAddresses);
    EXPECT_EQ(mixed.addresses, (Strings{"192.0.2.3"}));
    EXPECT_EQ(mixed.problems.size(), 4U);
    const ApplianceConfig unreadable = readApplianceConfig(path(""));
    EXPECT_FALSE(unreadable.servesAllAddresses);
    EXPECT_TRUE(unreadable.addresses.empty());
    EXPECT_EQ(unreadable.problems.size(), 1U);
}

TEST_F(Appliance, TheWebEngineListensOnTheConfiguredPorts) {
    EXPECT_EQ(ovraw3::Talo().GetHttpsPort(), 5001);
    writeFile(OvraPlatform::kConfigFile, "http_port=\"7000\"\nhttps_port=\"7001\"\n");
    ovraw3::Talo engine;
    EXPECT_EQ(engine.GetHttpPort(), 7000);
    EXPECT_EQ(engine.GetHttpsPort(), 7001);
}

TEST_F(Appliance, TheStateFolderIsForItsOwnerOnly) {
    umask(0);
    ASSERT_TRUE(ensureStateDir(path("var/state")));
    EXPECT_EQ(modeOf(path("var")), 0755U);
    EXPECT_EQ(modeOf(path("var/state")), 0700U);
    EXPECT_TRUE(ensureStateDir(path("var/state")));
}

TEST_F(Appliance, AStateFolderThatOthersCouldHavePreparedIsRefused) {
    std::filesystem::create_directory(path("real"));
    std::filesystem::create_symlink(path("real"), path("link"));
    EXPECT_FALSE(ensureStateDir(path("link")));
    std::filesystem::create_directory(path("wide"));
    chmod(path("wide").c_str(), 0770);
    EXPECT_FALSE(ensureStateDir(path("wide")));
    std::filesystem::create_directory(path("foreign"));
    chmod(path("foreign").c_str(), 0700);
    struct stat status {};
    if (chown(path("foreign").c_str(), 12345, 12345) == 0 &&
        stat(path("foreign").c_str(), &status) == 0 && status.st_uid == 12345) {
        EXPECT_FALSE(ensureStateDir(path("foreign")));
    }
    writeFile(path("file"), "");
    EXPECT_FALSE(ensureStateDir(path("file")));
    EXPECT_FALSE(ensureStateDir(path("file/state")));
}

} // namespace
