// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"

#include <string>
#include <vector>

/// What the stand-alone Linux platform fixes: its files and the appliance's settings. Formats,
/// modes and recovery of the files: docs/files.md.
namespace OvraPlatform {

/// Settings, keys and certificate: written by `ovradr setup` and by the operator. Mode 0755,
/// because the node identity and the node database live here too.
inline constexpr char kConfigDir[] = "/usr/ovra/etc/ovradr";
inline constexpr char kConfigFile[] = "/usr/ovra/etc/ovradr/ovradrd.conf";
inline constexpr char kTlsKeyFile[] = "/usr/ovra/etc/ovradr/ovradrd.key";         ///< mode 0600
inline constexpr char kTlsCertificateFile[] = "/usr/ovra/etc/ovradr/ovradrd.crt"; ///< mode 0644
inline constexpr char kSealKeyFile[] = "/usr/ovra/etc/ovradr/ovradrd.seal";       ///< mode 0600
inline constexpr char kFarlinkFile[] = "/usr/ovra/etc/ovradr/farlink.conf";

/// What the platform writes while it runs. Mode 0700.
inline constexpr char kStateDir[] = "/usr/ovra/var/ovradr";
inline constexpr char kFarlinkKeyFile[] = "/usr/ovra/var/ovradr/farlink.key"; ///< mode 0600
inline constexpr char kSocketFile[] = "/usr/ovra/var/ovradr/webapi.sock";
inline constexpr char kAccountsFile[] = "/usr/ovra/var/ovradr/accounts.db";
inline constexpr char kSessionsFile[] = "/usr/ovra/var/ovradr/sessions.db";
inline constexpr char kLoginsFile[] = "/usr/ovra/var/ovradr/logins.db";
inline constexpr char kDeviceKeyFile[] = "/usr/ovra/var/ovradr/device.key"; ///< mode 0600
inline constexpr char kKnownEndpointsFile[] = "/usr/ovra/var/ovradr/known_endpoints";

/// The library's caches, which all processes of the appliance share. Mode 0700.
inline constexpr char kCacheDir[] = "/tmp/.ovradrcache";

/// The keys of kConfigFile.
namespace Setting {
inline constexpr char kHttpPort[] = "http_port";
inline constexpr char kHttpsPort[] = "https_port";
inline constexpr char kAddress[] = "address"; ///< numeric addresses, separated by commas
inline constexpr char kHostname[] = "hostname";
inline constexpr char kSerial[] = "serial";
} // namespace Setting

/// The keys of kFarlinkFile.
namespace FarlinkSetting {
inline constexpr char kHost[] = "host";
inline constexpr char kPort[] = "port";
inline constexpr char kAlias[] = "alias";
} // namespace FarlinkSetting

/// The settings of this appliance, the lines key="value" of kConfigFile. A missing or empty key has
/// the default given here.
struct ApplianceConfig {
    int httpPort = 5000;
    int httpsPort = 5001;
    /// Whether the appliance serves on every address of the machine: no address is set.
    bool servesAllAddresses = true;
    /// Otherwise the addresses it serves on, as numeric text, in file order. Empty if the setting
    /// holds nothing usable.
    std::vector<std::string> addresses;
    std::string hostname; ///< empty: the system's
    std::string serial;   ///< empty: the machine's

    /// One sentence for each unusable part of the file; a server should not start while there are
    /// any.
    std::vector<std::string> problems;
};

/// Reads the settings. An unusable value is named in `problems` and in one ERR log line, and counts
/// as not set, except that an unusable `address` never widens to every address. A missing file
/// means defaults.
OVRAPLATFORM_EXPORT ApplianceConfig readApplianceConfig(const std::string &path = kConfigFile);

/// What is wrong with a value for a setting; "" if it is valid.
/// \param key  one of namespace Setting
OVRAPLATFORM_EXPORT std::string settingProblem(const std::string &key, const std::string &value);

/// Creates the state directory, mode 0700, and missing parents, mode 0755. An existing one must be
/// a directory owned by our own user that nobody else can write to.
/// \param path  kStateDir, or a path used in its place
/// \return false, after an ERR log line that says what to do, if it cannot be used.
[[nodiscard]] OVRAPLATFORM_EXPORT bool ensureStateDir(const std::string &path = kStateDir);

} // namespace OvraPlatform
