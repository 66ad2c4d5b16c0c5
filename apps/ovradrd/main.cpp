// SPDX-License-Identifier: Apache-2.0

// ovradrd: the web-API daemon of an appliance.

#include "daemon.h"
#include "service/memory.h"
#include "service/service_manager.h"
#include "version.h"

#include <ovrabase/file.h>
#include <ovradrcore/log.h>
#include <ovraplatform/appliance.h>

#include <CLI/CLI.hpp>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <exception>
#include <string>

namespace {

using Ovradrd::Daemon;
using OvraService::ExitCode;
using OvraService::StartError;

constexpr std::chrono::seconds kWorkPeriod{20};
/// Descriptors for the connections that it may have, and for everything else.
constexpr unsigned long kDescriptors = 4096;

constexpr char kFooter[] =
    "Serves in the foreground until SIGTERM or SIGINT; prints one line when it is ready. Settings\n"
    "are read from /usr/ovra/etc/ovradr/ovradrd.conf at the start, key and certificate also on\n"
    "SIGHUP; everything else goes to the system log. `ovradr setup` makes what it needs.\n\n"
    "Exit codes: 0 ended by a signal, 1 failed, 2 wrong usage, 3 a port is in use, 9 not set up.";

int fail(const StartError &why) {
    return OvraService::reportStartError("ovradrd", why);
}

tl::expected<Ovradrd::Settings, StartError> readSettings() {
    const auto refused = [](const std::string &what) {
        return tl::unexpected(
            StartError(ExitCode::kFailed, std::string(OvraPlatform::kConfigFile) + what));
    };
    const OvraPlatform::ApplianceConfig config = OvraPlatform::readApplianceConfig();
    if (!config.problems.empty()) {
        return refused(": " + config.problems.front() + ": correct the file");
    }
    if (!config.servesAllAddresses && config.addresses.empty()) {
        return refused(" names no address to serve at: correct it");
    }
    Ovradrd::Settings settings;
    settings.addresses = config.addresses;
    settings.httpPort = config.httpPort;
    settings.httpsPort = config.httpsPort;
    return settings;
}

/// \return what to tell the service manager
std::string reload(Daemon &daemon) {
    OvraService::tellReloading();
    const auto settings = readSettings();
    if (!settings) {
        OVRA_ERR("Goes on with its settings from before: %s", settings.error().text.c_str());
        return "Goes on with its settings from before: " + settings.error().text;
    }
    const auto restart = daemon.reload(*settings);
    if (!restart) {
        OVRA_ERR("Goes on with its certificate from before: %s", restart.error().text.c_str());
        return "Goes on with its certificate from before: " + restart.error().text;
    }
    if (*restart) {
        OVRA_WARN("The settings name other addresses or ports: restart ovradrd to serve there");
        return "Restart to serve at the addresses and ports of the settings";
    }
    OVRA_NOTICE("Key and certificate were read again");
    return "Key and certificate were read again";
}

/// Waits for the end, and has the daemon do its periodic work meanwhile.
void serveUntilEnd(Daemon &daemon, const OvraService::Signals &signals) {
    for (;;) {
        const OvraService::Order order = signals.wait(kWorkPeriod);
        if (order == OvraService::Order::kEnd) {
            return;
        }
        if (order == OvraService::Order::kReload) {
            OvraService::tellReady(reload(daemon));
        }
        daemon.doPeriodicWork();
        OvraService::returnFreedMemory();
        OvraService::tellAlive();
    }
}

int serve(bool logsCalls) {
    OvraService::keepMemorySmall();
    const OvraService::Signals signals;
    OvraService::raiseDescriptorLimit(kDescriptors);

    auto settings = readSettings();
    if (!settings) {
        return fail(settings.error());
    }
    settings->logsCalls = logsCalls;
    Daemon daemon(*settings);
    if (const auto started = daemon.start(); !started) {
        return fail(started.error());
    }
    OVRA_NOTICE("Serves at https port [%d] and http port [%d]", daemon.httpsPort(),
                daemon.httpPort());
    std::printf("ovradrd: ready, https %d, http %d\n", daemon.httpsPort(), daemon.httpPort());
    std::fflush(stdout);

    OvraService::tellReady("https " + std::to_string(daemon.httpsPort()) + ", http " +
                           std::to_string(daemon.httpPort()));

    serveUntilEnd(daemon, signals);
    OvraService::tellStopping();
    OVRA_NOTICE("Stops");
    if (!daemon.stop()) {
        OVRA_NOTICE("Calls that wait for other appliances are left");
        _exit(static_cast<int>(ExitCode::kOk));
    }
    return static_cast<int>(ExitCode::kOk);
}

} // namespace

int main(int argc, char **argv) {
    OvraBase::fillStandardDescriptors();
    OvraService::protectMemory();
    OvraService::openLog("ovradrd");
    try {
        CLI::App app("The web-API daemon of an appliance", "ovradrd");
        app.footer(kFooter);
        bool logsCalls = false;
        app.add_flag("--log-calls", logsCalls, "Logs every call, at level debug");
        app.set_version_flag("--version", std::string("ovradrd ") + Ovradrd::kVersion);
        try {
            app.parse(argc, argv);
        } catch (const CLI::ParseError &error) {
            return app.exit(error) == 0 ? EXIT_SUCCESS : static_cast<int>(ExitCode::kUsage);
        }
        return serve(logsCalls);
    } catch (const std::exception &error) {
        return OvraService::reportStartError("ovradrd", error);
    }
}
