// SPDX-License-Identifier: Apache-2.0
#include "host/host_identity.h"
#include "platform/own_files.h"

#include <string>

using namespace OvraPlatform;

namespace {

const std::string kMachineId = "3d1219c7c4c5404aaa1f6d2a48adfda4";

struct HostIdentity : OvraTest::OwnFiles {
    std::string serial(const std::string &firmware, const std::string &machineId,
                       const ApplianceConfig &config = {}) const {
        OvraTest::writeFile(path("dmi"), firmware);
        OvraTest::writeFile(path("machine-id"), machineId);
        return serialNumber(config, {path("dmi"), {path("machine-id")}});
    }
};

TEST_F(HostIdentity, TheConfiguredSerialNumberGoesFirstThenTheFirmwaresIfItIsReal) {
    EXPECT_EQ(serial("  VMX-56 4d ab \n", kMachineId, {.serial = "SET-BY-HAND"}), "SET-BY-HAND");
    EXPECT_EQ(serial("  VMX-56 4d ab \n", kMachineId), "VMX-56 4d ab");
    const std::string derived = serial("", kMachineId);
    for (const char *text : {"To Be Filled By O.E.M.\n", "Default string", "None", "00000000",
                             "System Serial Number", "x\ty\x01z", "...."}) {
        EXPECT_EQ(serial(text, kMachineId), derived) << text;
    }
}

TEST_F(HostIdentity, TheMachineIdGivesAStableNumberButIsNotPublished) {
    const std::string derived = serial("", kMachineId + "\n");
    EXPECT_EQ(derived.size(), 24U);
    EXPECT_EQ(derived, serial("", kMachineId));
    EXPECT_NE(derived, serial("", kMachineId.substr(0, 31) + "5"));
    for (std::size_t i = 0; i + 6 <= derived.size(); ++i) {
        EXPECT_EQ(kMachineId.find(derived.substr(i, 6)), std::string::npos);
    }
    for (const char *nobody : {"", "uninitialized\n", "00000000000000000000000000000000",
                               "3D1219C7C4C5404AAA1F6D2A48ADFDA4", "3d1219c7"}) {
        EXPECT_EQ(serial("none", nobody), "") << nobody;
    }
}

} // namespace
