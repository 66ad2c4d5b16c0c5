// SPDX-License-Identifier: Apache-2.0
#include "access.h"
#include "commands/commands.h"
#include "node_ref.h"
#include "output.h"
#include "provision/data_files.h"
#include "provision/node_database.h"
#include "service/certificate.h"
#include "usage.h"

#include <ovrabase/address.h>
#include <ovrabase/number.h>
#include <ovracore/ovracore.h>
#include <ovradrcore/cache_folder.h>
#include <ovradrcore/util.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_db.h>
#include <ovranet/ovranet.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/trust_store.h>

#include <unistd.h>

#include <array>
#include <memory>
#include <optional>
#include <vector>

namespace Ovradr {

namespace {

using OvraPlatform::ApplianceConfig;
namespace Setting = OvraPlatform::Setting;

constexpr int kMaxInterfaces = 32;

/// The given settings; the others stay as they are.
struct Settings {
    std::optional<std::string> hostname;
    std::optional<std::string> serial;
    std::optional<std::string> addresses;
    std::optional<int> httpPort;
    std::optional<int> httpsPort;
};

/// Refuses what the daemon could not use.
CLI::Validator usableAs(const char *key) {
    return {[key](const std::string &text) { return OvraPlatform::settingProblem(key, text); }, "",
            ""};
}

Expected<void> makeFolders() {
    using OvraPlatform::kConfigDir;
    if (!OvraDRCore::File::CreateDir(kConfigDir, 0755)) {
        return fileFailure(kConfigDir, errno);
    }
    if (!OvraPlatform::ensureStateDir()) {
        return failure(ExitCode::kNotSetUp,
                       std::string("The folder ") + OvraPlatform::kStateDir +
                           " cannot be made, or is not this user's alone.",
                       "Run the command as root; the system log says more.");
    }
    return {};
}

/// Writes the given settings; the others keep their lines.
Expected<SetUpStep> writeSettings(const Settings &settings) {
    std::vector<std::pair<const char *, std::string>> given;
    const auto add = [&given](const char *key, const std::optional<std::string> &value) {
        if (value) {
            given.emplace_back(key, *value);
        }
    };
    const auto number = [](const std::optional<int> &value) {
        return value ? std::optional(std::to_string(*value)) : std::nullopt;
    };
    add(Setting::kHostname, settings.hostname);
    add(Setting::kSerial, settings.serial);
    add(Setting::kAddress, settings.addresses);
    add(Setting::kHttpPort, number(settings.httpPort));
    add(Setting::kHttpsPort, number(settings.httpsPort));
    std::string names;
    for (const auto &[key, value] : given) {
        if (OLIBCFileSetKeyValue(OvraPlatform::kConfigFile, key, value.c_str(), "%s=\"%s\"\n") <
            0) {
            return failure(ExitCode::kNotSetUp,
                           std::string(OvraPlatform::kConfigFile) + " cannot be written.",
                           "Run the command as root, on a disk that is not full.");
        }
        names += (names.empty() ? ": " : ", ") + std::string(key);
    }
    return SetUpStep{"settings", !given.empty(), OvraPlatform::kConfigFile + names};
}

/// The resulting settings; refused if the appliance could not serve with them.
Expected<ApplianceConfig> checkSettings(const Settings &settings) {
    ApplianceConfig config = OvraPlatform::readApplianceConfig();
    config.httpPort = settings.httpPort.value_or(config.httpPort);
    config.httpsPort = settings.httpsPort.value_or(config.httpsPort);
    if (config.httpPort == config.httpsPort) {
        return failure(ExitCode::kUsage,
                       "HTTP and HTTPS cannot both have port " + std::to_string(config.httpPort) +
                           ".",
                       "Choose another one with --http-port or --https-port.");
    }
    return config;
}

Expected<void> checkFile() {
    const ApplianceConfig config = OvraPlatform::readApplianceConfig();
    if (config.problems.empty()) {
        return {};
    }
    return failure(ExitCode::kNotSetUp,
                   std::string(OvraPlatform::kConfigFile) + ": " + config.problems.front() + ".",
                   "Correct the file and run `ovradr setup` again.");
}

OvraService::ServerNames serverNames() {
    std::array<OLIBNetInterface, kMaxInterfaces> interfaces{};
    const int count = OLIBNetGetInterfaceInfo(interfaces.data(), kMaxInterfaces,
                                              OLIB_NET_SELECT_IPV4 | OLIB_NET_SELECT_IPV6);
    OvraService::ServerNames names{OvraDRNode::DRNode::getLocalHostName(), {}};
    for (int i = 0; i < count; ++i) {
        names.addresses.emplace_back(interfaces.at(static_cast<std::size_t>(i)).address);
    }
    return names;
}

Expected<SetUpStep> provisionSealKey() {
    const bool there = access(OvraPlatform::kSealKeyFile, F_OK) == 0;
    const auto keys = OvraPlatform::SealKeyPair::loadOrCreate(OvraPlatform::kSealKeyFile);
    if (!keys) {
        return failure(ExitCode::kNotSetUp, "No sealing key: " + keys.error() + ".",
                       "Correct that and run `ovradr setup` again.");
    }
    return SetUpStep{"sealing key", !there, OvraPlatform::kSealKeyFile};
}

Refusal keyFailure(const std::string &path, const OvraBase::Error &why) {
    if (why.number != 0) {
        return fileFailure(path, why.number);
    }
    return failure(ExitCode::kNotSetUp, why.text + ".",
                   "Restore the file from a backup, or move it away and run `ovradr setup` again; "
                   "who has trusted the old key will be warned.");
}

Expected<SetUpStep> provisionTlsKey() {
    using OvraPlatform::kTlsKeyFile;
    const Expected<bool> tightened = makePrivate(kTlsKeyFile);
    if (!tightened) {
        return Refusal(tightened.error());
    }
    const OvraBase::Expected<bool> made = OvraService::createTlsKey(kTlsKeyFile);
    if (!made) {
        return keyFailure(kTlsKeyFile, made.error());
    }
    return SetUpStep{"HTTPS key", *made,
                     std::string(kTlsKeyFile) + (*tightened ? ", now closed to other users" : "")};
}

Expected<SetUpStep> provisionCertificate() {
    using OvraPlatform::kTlsCertificateFile;
    const OvraBase::Expected<bool> made = OvraService::createCertificate(
        kTlsCertificateFile, OvraPlatform::kTlsKeyFile, serverNames());
    if (!made) {
        return keyFailure(kTlsCertificateFile, made.error());
    }
    return SetUpStep{"HTTPS certificate", *made, kTlsCertificateFile};
}

/// Makes the file of trusted keys, unless it may have been lost: then only a person trusts anew.
Expected<SetUpStep> provisionTrust() {
    using OvraPlatform::kKnownEndpointsFile;
    OvraPlatform::TrustStore store;
    const std::string problem = store.problem();
    const auto creds = allCredentials();
    if (!creds) {
        return Refusal(creds.error());
    }
    if (!problem.empty() && !creds->empty()) {
        return SetUpStep{"trusted keys", false,
                         std::string(kKnownEndpointsFile) + ": " + problem +
                             ", though this node has credentials; see `ovradr doctor`"};
    }
    if (!store.create()) {
        return failure(ExitCode::kNotSetUp, std::string(kKnownEndpointsFile) + " cannot be used.",
                       "Correct or restore it; the system log says more.");
    }
    return SetUpStep{"trusted keys", !problem.empty(), kKnownEndpointsFile};
}

Expected<SetUpStep> provisionCacheFolder() {
    const bool there = access(OvraPlatform::kCacheDir, F_OK) == 0;
    const std::string problem = OvraDRCore::prepareCacheFolder(OvraPlatform::kCacheDir);
    if (!problem.empty()) {
        return failure(ExitCode::kNotSetUp,
                       std::string(OvraPlatform::kCacheDir) + " " + problem + ".",
                       "Correct that and run `ovradr setup` again.");
    }
    return SetUpStep{"cache folder", !there, OvraPlatform::kCacheDir};
}

Expected<SetUpStep> provisionNodeId() {
    const std::string file = std::string(OvraPlatform::kConfigDir) + "/node.info";
    const bool there = OLIBCFileExist(file.c_str()) != 0;
    const std::string nodeId = OvraDRNode::DRNode::getLocalNodeId();
    if (nodeId.empty()) {
        return failure(ExitCode::kNotSetUp, "The node id can be neither read nor made.",
                       "The system log says why.");
    }
    return SetUpStep{"node id", !there, nodeId};
}

Report reportOf(const std::vector<SetUpStep> &steps) {
    Report report;
    std::vector<std::vector<std::string>> rows;
    for (const SetUpStep &step : steps) {
        const char *state = step.made ? "made" : "kept";
        rows.push_back({step.what, state, step.detail});
        Json::Value item;
        item["what"] = step.what;
        item["made"] = step.made;
        item["detail"] = step.detail;
        report.data["steps"].append(item);
    }
    report.data["node_id"] = OvraDRNode::DRNode::getLocalNodeId();
    const auto sealing = OvraPlatform::SealKeyPair::load(OvraPlatform::kSealKeyFile);
    const std::string https =
        OvraService::certificateFingerprint(OvraPlatform::kTlsCertificateFile);
    const std::string http = sealing ? OvraPlatform::fingerprintOf(sealing->publicKey()) : "";
    report.data["fingerprints"]["https"] = https;
    report.data["fingerprints"]["http"] = http;
    report.text = table({"WHAT", "STATE", "DETAIL"}, rows) +
                  "\nWho pairs with this appliance is shown one of these keys:\n" +
                  listing({{"  over https", https}, {"  over http", http}});
    return report;
}

Outcome setUp(const Settings &settings) {
    const Expected<ApplianceConfig> config = checkSettings(settings);
    if (!config) {
        return Refusal(config.error());
    }
    const Expected<std::string> schema = findDataFile("node.sql");
    if (!schema) {
        return Refusal(schema.error());
    }
    if (const auto made = makeFolders(); !made) {
        return Refusal(made.error());
    }
    std::vector<SetUpStep> done;
    const std::vector<std::function<Expected<SetUpStep>()>> steps = {
        [&settings] { return writeSettings(settings); },
        [&schema] { return provisionNodeDatabase(nodeDatabasePath(), *schema); },
        provisionTlsKey,
        provisionCertificate,
        provisionSealKey,
        provisionTrust,
        provisionNodeId,
        provisionScripts,
        provisionCacheFolder,
    };
    for (const auto &step : steps) {
        const Expected<SetUpStep> result = step();
        if (!result) {
            return Refusal(result.error());
        }
        done.push_back(*result);
    }
    if (const auto usable = checkFile(); !usable) {
        return Refusal(usable.error());
    }
    return reportOf(done);
}

} // namespace

void addSetupCommand(CLI::App &app, Command &chosen) {
    CLI::App *command = app.add_subcommand(
        "setup", "Make what a fresh machine needs: folders, database, keys, node id, scripts.");
    const auto settings = std::make_shared<Settings>();
    command->add_option("--hostname", settings->hostname, "Name of this appliance")
        ->check(usableAs(Setting::kHostname));
    command
        ->add_option("--serial", settings->serial, "Serial number to show instead of the machine's")
        ->check(usableAs(Setting::kSerial));
    command
        ->add_option("--address", settings->addresses,
                     "Numeric addresses to serve at, separated by commas; \"\" for all")
        ->check(usableAs(Setting::kAddress));
    command->add_option("--http-port", settings->httpPort, "Port for HTTP (5000)")
        ->check(wholeNumber(1, OvraBase::kMaxPort));
    command->add_option("--https-port", settings->httpsPort, "Port for HTTPS (5001)")
        ->check(wholeNumber(1, OvraBase::kMaxPort));
    command->footer("What is there already stays as it is.\n"
                    "Examples:\n"
                    "  ovradr setup\n"
                    "  ovradr setup --hostname nas1 --address 192.0.2.10,2001:db8::10");
    command->callback(
        [&chosen, settings] { chosen = forOwnUser([settings] { return setUp(*settings); }); });
}

} // namespace Ovradr
