// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/appliance.h"

#include "host/key_value_file.h"

#include <ovrabase/address.h>
#include <ovrabase/file.h>
#include <ovrabase/number.h>
#include <ovradrcore/log.h>
#include <ovradrcore/no_fork.h>
#include <ovradrcore/util.h>

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <mutex>
#include <string_view>

namespace OvraPlatform {

namespace {

constexpr std::size_t kMaxHostname = 253; // RFC 1035, 2.3.4, as text
constexpr std::size_t kMaxSerial = 64;
constexpr std::size_t kMaxAddresses = 32; // as many as the node library asks for
constexpr std::size_t kMaxNamedLines = 5;

using Lines = std::vector<KeyValueLine>;

std::string valueOf(const Lines &lines, std::string_view key) {
    const auto line = std::find_if(lines.rbegin(), lines.rend(),
                                   [key](const KeyValueLine &entry) { return entry.key == key; });
    return line == lines.rend() ? std::string() : line->value;
}

void readPort(const Lines &lines, const char *key, int &port, std::vector<std::string> &problems) {
    const std::string text = valueOf(lines, key);
    if (text.empty()) {
        return;
    }
    const std::optional<int> number = OvraBase::parsePort(text);
    if (!number) {
        problems.push_back(std::string(key) + " is [" + text + "], not a port (1 to 65535), so " +
                           std::to_string(port) + " counts");
        return;
    }
    port = *number;
}

void readAddresses(const Lines &lines, ApplianceConfig &config) {
    const std::string list = valueOf(lines, Setting::kAddress);
    config.servesAllAddresses = list.empty();
    for (std::size_t begin = 0; begin < list.size();) {
        const std::size_t comma = std::min(list.find(',', begin), list.size());
        std::string address = list.substr(begin, comma - begin);
        begin = comma + 1;
        address.erase(0, address.find_first_not_of(" \t"));
        address.erase(address.find_last_not_of(" \t") + 1);
        if (!OvraBase::isNumericAddress(address)) {
            config.problems.push_back("address holds [" + address +
                                      "], not a numeric IPv4 or IPv6 address");
        } else if (OvraBase::isIpv6LinkLocal(address)) {
            config.problems.push_back("address holds [" + address +
                                      "], a link-local address, which is the same on every link: "
                                      "name another one");
        } else if (config.addresses.size() == kMaxAddresses) {
            config.problems.push_back("address holds more than " + std::to_string(kMaxAddresses) +
                                      " addresses");
            return;
        } else {
            config.addresses.push_back(address);
        }
    }
}

template <typename Allowed>
void readText(const Lines &lines, const char *key, std::size_t longest, Allowed allowed,
              std::string &text, std::vector<std::string> &problems) {
    const std::string value = valueOf(lines, key);
    if (value.size() > longest || !std::all_of(value.begin(), value.end(), allowed)) {
        problems.push_back(std::string(key) + " has special characters or more than " +
                           std::to_string(longest) + " characters");
        return;
    }
    text = value;
}

bool isHostnameCharacter(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '-' || c == '.' || c == '_';
}

bool isPrintable(char c) {
    return c >= ' ' && c <= '~';
}

void nameBrokenLines(const Lines &lines, std::vector<std::string> &problems) {
    for (std::size_t i = 0; i < lines.size() && problems.size() < kMaxNamedLines; ++i) {
        if (!lines[i].wellFormed) {
            problems.push_back("line " + std::to_string(i + 1) +
                               " is not of the form key=\"value\"");
        }
    }
}

void takeSettings(const Lines &lines, ApplianceConfig &config) {
    readPort(lines, Setting::kHttpPort, config.httpPort, config.problems);
    readPort(lines, Setting::kHttpsPort, config.httpsPort, config.problems);
    readAddresses(lines, config);
    readText(lines, Setting::kHostname, kMaxHostname, isHostnameCharacter, config.hostname,
             config.problems);
    readText(lines, Setting::kSerial, kMaxSerial, isPrintable, config.serial, config.problems);
}

/// The settings are read often: the same problems are logged once per process.
void logOnce(const std::string &path, const std::vector<std::string> &problems) {
    static OvraDRCore::ForkSafeMutex mutex;
    static std::string lastLogged;
    std::string text;
    for (const std::string &problem : problems) {
        text += (text.empty() ? "" : "; ") + problem;
    }
    const std::lock_guard lock(mutex);
    if (!text.empty() && text != lastLogged) {
        OVRA_ERR("Settings in [%s] are not usable: %s. Correct the file.", path.c_str(),
                 text.c_str());
    }
    lastLogged = text;
}

bool makeFolder(const std::string &path, mode_t mode) {
    return OvraDRCore::File::CreateDir(OvraBase::folderOf(path), 0755) &&
           OvraDRCore::File::CreateDir(path, mode);
}

} // namespace

ApplianceConfig readApplianceConfig(const std::string &path) {
    ApplianceConfig config;
    const OvraBase::Expected<std::string> text = OvraBase::readFile(path);
    if (!text && text.error().number != ENOENT) {
        // What cannot be read may hold a limit to certain addresses.
        config.servesAllAddresses = false;
        config.problems.push_back("it cannot be read (" + text.error().text + ")");
    }
    const Lines lines = parseKeyValueLines(text.value_or(""));
    nameBrokenLines(lines, config.problems);
    if (text) {
        takeSettings(lines, config);
    }
    logOnce(path, config.problems);
    return config;
}

std::string settingProblem(const std::string &key, const std::string &value) {
    if (value.find('"') != std::string::npos) {
        return key + " cannot hold quotes";
    }
    KeyValueLine line;
    line.key = key;
    line.value = value;
    ApplianceConfig config;
    takeSettings({line}, config);
    return config.problems.empty() ? "" : config.problems.front();
}

bool ensureStateDir(const std::string &path) {
    struct stat status {};
    if (!makeFolder(path, 0700) || lstat(path.c_str(), &status) != 0) {
        OVRA_ERR("The state folder [%s] cannot be made. Run as the user that owns it, on a disk "
                 "that can be written to.",
                 path.c_str());
        return false;
    }
    if (!S_ISDIR(status.st_mode) || status.st_uid != geteuid() ||
        (status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        OVRA_ERR("The state folder [%s] is not a folder of our own user alone. Remove it, or set "
                 "its owner and mode 0700.",
                 path.c_str());
        return false;
    }
    return true;
}

} // namespace OvraPlatform
