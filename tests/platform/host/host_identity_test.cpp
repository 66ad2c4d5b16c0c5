// SPDX-License-Identifier: Apache-2.0
#include "host/host_identity.h"
#include "platform/own_files.h"

#include <ovracore/ovracore.h>

#include <array>
#include <string>

using OvraPlatform::HostFiles;
using OvraPlatform::serialNumber;
using OvraTest::writeFile;

namespace {

constexpr char kMachineId[] = "3d1219c7c4c5404aaa1f6d2a48adfda4";

struct HostIdentity : OvraTest::OwnFiles {
    std::string serial(const std::string &firmware, const std::string &machineId) const {
        writeFile(path("dmi"), firmware);
        writeFile(path("machine-id"), machineId);
        return serialNumber({}, files());
    }
    HostFiles files() const { return {path("dmi"), {path("machine-id")}}; }
};

TEST_F(HostIdentity, TheConfiguredSerialNumberGoesFirstThenTheFirmwares) {
    EXPECT_EQ(serial("  VMX-56 4d ab \n", kMachineId), "VMX-56 4d ab");
    OvraPlatform::ApplianceConfig config;
    config.serial = "SET-BY-HAND";
    EXPECT_EQ(serialNumber(config, files()), "SET-BY-HAND");
}

TEST_F(HostIdentity, AFirmwareWithoutARealNumberIsPassedOver) {
    const std::string derived = serial("", kMachineId);
    for (const char *text : {"To Be Filled By O.E.M.\n", "Default string", "None", "00000000",
                             "System Serial Number", "x\ty\x01z", "...."}) {
        EXPECT_EQ(serial(text, kMachineId), derived) << text;
    }
}

TEST_F(HostIdentity, TheMachineIdGivesAStableNumberButIsNotPublished) {
    const std::string derived = serial("", std::string(kMachineId) + "\n");
    EXPECT_EQ(derived.size(), 24U);
    EXPECT_EQ(derived, serial("", kMachineId));
    std::string other = kMachineId;
    other.back() = '5';
    EXPECT_NE(derived, serial("", other));
    for (std::size_t i = 0; i + 6 <= derived.size(); ++i) {
        EXPECT_EQ(std::string(kMachineId).find(derived.substr(i, 6)), std::string::npos);
    }
}

TEST_F(HostIdentity, AMachineThatIsNobodyHasNone) {
    for (const char *text : {"", "uninitialized\n", "00000000000000000000000000000000",
                             "3D1219C7C4C5404AAA1F6D2A48ADFDA4", "3d1219c7"}) {
        EXPECT_EQ(serial("none", text), "") << text;
    }
}

TEST_F(HostIdentity, IsReadThroughThePlatformInterface) {
    std::array<char, 64> system{};
    ASSERT_EQ(gethostname(system.data(), system.size()), 0);
    std::array<char, 64> buffer{};
    EXPECT_EQ(OVRALnxGetHostname(buffer.data(), 64), static_cast<int>(strlen(system.data())));
    EXPECT_STREQ(buffer.data(), system.data());
    writeFile(OvraPlatform::kConfigFile, "hostname=\"node-7\"\nserial=\"S-0007\"\n");
    EXPECT_EQ(OVRALnxGetHostname(buffer.data(), 64), 6);
    EXPECT_STREQ(buffer.data(), "node-7");
    EXPECT_EQ(OLIBGetSerialNumber(buffer.data(), 64), 6);
    EXPECT_STREQ(buffer.data(), "S-0007");
    EXPECT_LT(OLIBGetSerialNumber(buffer.data(), 6), 0);
}

} // namespace
