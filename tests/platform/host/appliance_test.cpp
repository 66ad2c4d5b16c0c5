// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"

#include <ovracore/ovracore.h>
#include <ovraplatform/appliance.h>
#include <ovraw3/talo.h>

#include <array>
#include <string>

using namespace OvraPlatform;
using namespace OvraTest;

namespace {

struct Appliance : OwnFiles {
    /// Ports, names, addresses and the number of problems.
    static std::string shown(const ApplianceConfig &config) {
        std::string text = std::to_string(config.httpPort) + " " +
                           std::to_string(config.httpsPort) + " [" + config.hostname + "] [" +
                           config.serial + "] " + (config.servesAllAddresses ? "all " : "");
        for (const std::string &address : config.addresses) {
            text += address + " ";
        }
        return text + std::to_string(config.problems.size());
    }
    std::string read(const std::string &text) const {
        writeFile(path("conf"), text);
        return shown(readApplianceConfig(path("conf")));
    }
};

TEST_F(Appliance, NamesWhatItCannotUseAndGoesOnWithout) {
    EXPECT_EQ(read("http_port=\"8080\"\nhttps_port=8443\naddress=\"192.0.2.7, 2001:db8::7\"\n"
                   "hostname=\"store-1.example\"\nserial=\"AB 12\"\n"),
              "8080 8443 [store-1.example] [AB 12] 192.0.2.7 2001:db8::7 0");
    EXPECT_EQ(shown(readApplianceConfig(path("absent"))), "5000 5001 [] [] all 0");
    for (const char *text :
         {"http_port=\"0\"\n", "http_port=\"65536\"\n", "https_port=\"80x\"\n",
          "https_port=\" 443 443\"\n", "http_port=\"8080\n", "hostname=\"two words\"\n",
          "hostname=\"../../etc\"\n", "serial=\"a\tb\"\n", "\x7F\x45\x4C\x46\n"}) {
        EXPECT_EQ(read(text), "5000 5001 [] [] all 1") << text;
    }
    // An unusable address never means every address.
    EXPECT_EQ(read("address=\"192.0.2.300,192.0.2.3,,host,fe80::1\"\n"),
              "5000 5001 [] [] 192.0.2.3 4");
    EXPECT_EQ(shown(readApplianceConfig(path(""))), "5000 5001 [] [] 1") << "unreadable";
}

TEST_F(Appliance, IsKnownThroughThePlatformInterface) {
    std::array<char, 64> system{};
    ASSERT_EQ(gethostname(system.data(), system.size()), 0);
    std::array<char, 64> buffer{};
    EXPECT_EQ(OVRALnxGetHostname(buffer.data(), 64), static_cast<int>(strlen(system.data())));
    EXPECT_STREQ(buffer.data(), system.data());
    EXPECT_EQ(ovraw3::Talo().GetHttpsPort(), 5001);
    writeFile(kConfigFile,
              "hostname=\"node-7\"\nserial=\"S-0007\"\nhttp_port=7000\nhttps_port=7001\n");
    EXPECT_EQ(OVRALnxGetHostname(buffer.data(), 64), 6);
    EXPECT_STREQ(buffer.data(), "node-7");
    EXPECT_EQ(OLIBGetSerialNumber(buffer.data(), 64), 6);
    EXPECT_STREQ(buffer.data(), "S-0007");
    EXPECT_LT(OLIBGetSerialNumber(buffer.data(), 6), 0);
    EXPECT_EQ(ovraw3::Talo().GetHttpPort(), 7000);
    EXPECT_EQ(ovraw3::Talo().GetHttpsPort(), 7001);
}

TEST_F(Appliance, HasAStateFolderThatNobodyElseCouldHavePrepared) {
    umask(0);
    ASSERT_TRUE(ensureStateDir(path("var/state")));
    EXPECT_EQ(modeOf(path("var")), 0755U);
    EXPECT_EQ(modeOf(path("var/state")), 0700U);
    EXPECT_TRUE(ensureStateDir(path("var/state")));
    std::filesystem::create_symlink(path("var/state"), path("link"));
    EXPECT_FALSE(ensureStateDir(path("link")));
    chmod(path("var/state").c_str(), 0770);
    EXPECT_FALSE(ensureStateDir(path("var/state")));
    chmod(path("var/state").c_str(), 0700);
    struct stat status {};
    if (chown(path("var/state").c_str(), 12345, 12345) == 0 &&
        stat(path("var/state").c_str(), &status) == 0 && status.st_uid == 12345) {
        EXPECT_FALSE(ensureStateDir(path("var/state")));
    }
    writeFile(path("file"), "");
    EXPECT_FALSE(ensureStateDir(path("file")));
    EXPECT_FALSE(ensureStateDir(path("file/state")));
}

} // namespace
