// SPDX-License-Identifier: Apache-2.0
#include "host/host_identity.h"

#include "ovracore/ovracore.h"

#include <ovrabase/address.h>
#include <ovrabase/file.h>
#include <ovradrcore/log.h>

#include <sodium.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <string_view>

namespace OvraPlatform {

namespace {

constexpr std::size_t kMinSerial = 4;
constexpr std::size_t kMaxSerial = 64;
constexpr std::size_t kMachineIdDigits = 32; // machine-id(5)

/// In lower case, as mainboard and virtual machine makers ship them.
constexpr std::string_view kPlaceholders[] = {
    "to be filled by o.e.m.",
    "default string",
    "system serial number",
    "not specified",
    "not applicable",
    "none",
    "unknown",
    "invalid",
    "123456789",
    "0123456789",
    "1234567890",
    "chassis serial number",
};

std::string firstLine(const std::string &path) {
    std::string text = OvraBase::readFile(path).value_or("");
    text.erase(std::min(text.find('\n'), text.size()));
    text.erase(0, text.find_first_not_of(" \t"));
    text.erase(text.find_last_not_of(" \t\r") + 1);
    return text;
}

bool isSerial(std::string text) {
    if (text.size() < kMinSerial || text.size() > kMaxSerial ||
        !std::all_of(text.begin(), text.end(), [](char c) { return c >= ' ' && c <= '~'; })) {
        return false;
    }
    text = OvraBase::toLower(text);
    const bool oneCharacter = text.find_first_not_of(text.front()) == std::string::npos;
    return !oneCharacter && std::find(std::begin(kPlaceholders), std::end(kPlaceholders), text) ==
                                std::end(kPlaceholders);
}

bool isMachineId(const std::string &text) {
    return text.size() == kMachineIdDigits &&
           text.find_first_not_of("0123456789abcdef") == std::string::npos &&
           text.find_first_not_of('0') != std::string::npos;
}

/// A hash keyed with the machine id, as machine-id(5) asks for.
std::string derivedSerial(const std::string &machineId) {
    constexpr std::string_view kPurpose = "OvraDRNode appliance serial number";
    std::array<unsigned char, crypto_generichash_BYTES_MIN> hash{};
    constexpr std::size_t kTaken = 12;
    crypto_generichash(hash.data(), hash.size(),
                       reinterpret_cast<const unsigned char *>(kPurpose.data()), kPurpose.size(),
                       reinterpret_cast<const unsigned char *>(machineId.data()), machineId.size());
    std::array<char, 2 * kTaken + 1> hex{};
    sodium_bin2hex(hex.data(), hex.size(), hash.data(), kTaken);
    return hex.data();
}

int copyOut(const std::string &text, char *buffer, int size) {
    if (buffer == nullptr || size <= 0 || text.empty() ||
        text.size() >= static_cast<std::size_t>(size)) {
        return -1;
    }
    std::memcpy(buffer, text.c_str(), text.size() + 1);
    return static_cast<int>(text.size());
}

} // namespace

std::string serialNumber(const ApplianceConfig &config, const HostFiles &files) {
    if (!config.serial.empty()) {
        return config.serial;
    }
    if (std::string serial = firstLine(files.serial); isSerial(serial)) {
        return serial;
    }
    for (const std::string &path : files.machineIds) {
        if (const std::string machineId = firstLine(path); isMachineId(machineId)) {
            return derivedSerial(machineId);
        }
    }
    OVRA_ERR("This machine has neither a serial number nor a machine id. Set serial in [%s].",
             kConfigFile);
    return {};
}

std::string hostName(const ApplianceConfig &config) {
    if (!config.hostname.empty()) {
        return config.hostname;
    }
    std::array<char, 256> name{};
    return gethostname(name.data(), name.size() - 1) == 0 ? std::string(name.data())
                                                          : std::string();
}

} // namespace OvraPlatform

int OLIBGetSerialNumber(char *buffer, int size) {
    return OvraPlatform::copyOut(OvraPlatform::serialNumber(OvraPlatform::readApplianceConfig()),
                                 buffer, size);
}

int OVRALnxGetHostname(char *buffer, int size) {
    return OvraPlatform::copyOut(OvraPlatform::hostName(OvraPlatform::readApplianceConfig()),
                                 buffer, size);
}
