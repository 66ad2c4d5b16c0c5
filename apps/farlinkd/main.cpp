// SPDX-License-Identifier: Apache-2.0

// farlinkd: the relay service, which makes appliances without incoming connections reachable under
// an alias.

#include "alias_registry.h"
#include "relay_api.h"
#include "service/certificate.h"
#include "service/http_server.h"
#include "service/listener.h"
#include "service/memory.h"
#include "service/service_manager.h"
#include "service/startup.h"
#include "service/tls_identity.h"
#include "tunnel_server.h"

#include <ovrabase/file.h>
#include <ovrabase/number.h>
#include <ovracore/ovracore.h>
#include <ovradrcore/log.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/farlink.h>

#include <CLI/CLI.hpp>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <exception>
#include <string>

namespace Farlinkd {

namespace {

using OvraBase::Expected;
using OvraService::ExitCode;
using OvraService::HttpServer;
using OvraService::Listener;
using OvraService::StartError;
using OvraService::TlsIdentity;

constexpr unsigned long kDescriptors = 16384;
constexpr int kMaxAliases = 4000; // what fits into the file of aliases, with room to spare
constexpr long kMaxLease = 10L * 365 * 24 * 60 * 60; // seconds
constexpr std::chrono::seconds kTick{1};
constexpr int kTicksOfMemory = 20; // between two times at which freed memory is returned

struct Options {
    std::string address;
    std::string host;
    std::string state = "/usr/ovra/var/farlinkd";
    int port = OvraPlatform::kFarlinkPort;
    int tunnelPort = OvraPlatform::kFarlinkPort + 1;
    int firstPort = 20000;
    int lastPort = 20999;
    long leaseSeconds = 30L * 24 * 60 * 60;
};

constexpr char kFooter[] =
    "Serves in the foreground until SIGTERM or SIGINT; prints two lines when it is ready. Makes "
    "its\n"
    "key and certificate at the first start. Everything else goes to the system log.\n\n"
    "Exit codes: 0 ended by a signal, 1 failed, 2 wrong usage, 3 a port is in use.";

int fail(const StartError &why) {
    return OvraService::reportStartError("farlinkd", why);
}

std::string ownName() {
    std::array<char, 256> name{};
    return OVRALnxGetHostname(name.data(), static_cast<int>(name.size())) > 0 ? name.data()
                                                                              : "farlinkd";
}

std::string certificateIn(const Options &options) {
    return options.state + "/farlinkd.crt";
}

/// The key and certificate of the service, created if there are none.
Expected<TlsIdentity> identityIn(const Options &options) {
    const std::string key = options.state + "/farlinkd.key";
    const std::string certificate = certificateIn(options);
    if (!OvraPlatform::ensureStateDir(options.state)) {
        return OvraBase::Unexpected({options.state + " cannot be made or is not this user's alone: "
                                                     "name another folder with --state"});
    }
    const OvraService::ServerNames names{options.host.empty() ? ownName() : options.host, {}};
    for (const auto &made : {OvraService::createTlsKey(key),
                             OvraService::createCertificate(certificate, key, names)}) {
        if (!made) {
            return OvraBase::Unexpected(made.error());
        }
    }
    return TlsIdentity::load(key, certificate);
}

/// \return what to tell the service manager
std::string reload(const Options &options, HttpServer &http) {
    OvraService::tellReloading();
    const auto identity = identityIn(options);
    const auto renewed = identity ? http.renew(*identity) : OvraBase::Unexpected(identity.error());
    if (!renewed) {
        OVRA_ERR("Goes on with its certificate from before: %s", renewed.error().text.c_str());
        return "Goes on with its certificate from before: " + renewed.error().text;
    }
    OVRA_NOTICE("Key and certificate were read again");
    return "Key and certificate were read again";
}

void serveUntilEnd(const OvraService::Signals &signals, const Options &options, RelayApi &api,
                   HttpServer &http) {
    for (int tick = 1;; ++tick) {
        const OvraService::Order order = signals.wait(kTick);
        if (order == OvraService::Order::kEnd) {
            return;
        }
        if (order == OvraService::Order::kReload) {
            OvraService::tellReady(reload(options, http));
        }
        api.endOverdue();
        if (tick % kTicksOfMemory == 0) {
            OvraService::returnFreedMemory();
            OvraService::tellAlive();
        }
    }
}

int serve(const Options &options) {
    OvraService::keepMemorySmall();
    const OvraService::Signals signals;
    OvraService::raiseDescriptorLimit(kDescriptors);

    const auto identity = identityIn(options);
    if (!identity) {
        return fail(identity.error());
    }
    AliasRegistry aliases(options.state + "/aliases", {options.firstPort, options.lastPort,
                                                       std::chrono::seconds(options.leaseSeconds)});
    if (const auto loaded = aliases.load(); !loaded) {
        return fail(loaded.error());
    }
    auto https = Listener::listen(options.address, options.port);
    auto tunnel = Listener::listen(options.address, options.tunnelPort);
    for (const auto *listener : {&https, &tunnel}) {
        if (!*listener) {
            const OvraBase::Error &why = listener->error();
            return fail(
                {why.number == EADDRINUSE ? ExitCode::kPortInUse : ExitCode::kFailed, why.text});
        }
    }
    const int port = https->port;
    const int tunnelPort = tunnel->port;

    RelayApi api(aliases, {options.address, options.host, tunnelPort}, {});
    TunnelServer tunnelServer(
        [&api](const std::string &alias, const std::string &caller, const std::string &client) {
            return api.announce(alias, caller, client);
        },
        {});
    OvraService::HttpLimits limits;
    limits.connections.total = 4096;
    limits.body = limits.unjudged; // no call of the service is longer than a log-in
    HttpServer http(
        [&api](OvraService::HttpRequest request, const HttpServer::Answer &answer) {
            api.serve(std::move(request), answer);
        },
        limits);
    if (const auto started = tunnelServer.start(std::move(*tunnel)); !started) {
        return fail(started.error());
    }
    api.connect(tunnelServer);
    std::vector<Listener> listeners;
    listeners.push_back(std::move(*https));
    if (const auto started = http.start(std::move(listeners), {}, *identity); !started) {
        return fail(started.error());
    }
    OVRA_NOTICE("Serves at port [%d], for appliances at port [%d], for callers at ports [%d-%d]",
                port, tunnelPort, options.firstPort, options.lastPort);
    std::printf("farlinkd: ready, https %d, tunnels %d, aliases %d-%d\nfarlinkd: key %s\n", port,
                tunnelPort, options.firstPort, options.lastPort,
                OvraService::certificateFingerprint(certificateIn(options)).c_str());
    std::fflush(stdout);

    OvraService::tellReady("https " + std::to_string(port) + ", tunnels " +
                           std::to_string(tunnelPort));

    serveUntilEnd(signals, options, api, http);
    OvraService::tellStopping();
    OVRA_NOTICE("Stops");
    http.quiesce();
    api.stop();
    http.stop();
    return static_cast<int>(ExitCode::kOk);
}

int run(int argc, char **argv) {
    Options options;
    CLI::App app("The relay service: appliances without a way in are reached under an alias",
                 "farlinkd");
    app.footer(kFooter);
    app.set_version_flag("--version", "farlinkd " FARLINKD_VERSION);
    app.add_option("--address", options.address, "Numeric address to serve at (all)");
    app.add_option("--host", options.host,
                   "Name or address that callers are told (the one they know the service by)");
    app.add_option("--port", options.port, "Port of the service (5443)")
        ->check(CLI::Range(0, OvraBase::kMaxPort));
    app.add_option("--tunnel-port", options.tunnelPort, "Port for the appliances (5444)")
        ->check(CLI::Range(0, OvraBase::kMaxPort));
    app.add_option("--first-port", options.firstPort,
                   "First port for callers, one an alias (20000)")
        ->check(CLI::Range(1, OvraBase::kMaxPort));
    app.add_option("--last-port", options.lastPort, "Last one (20999)")
        ->check(CLI::Range(1, OvraBase::kMaxPort));
    app.add_option("--lease", options.leaseSeconds,
                   "Seconds for which an alias stays its owner's when that is gone (30 days)")
        ->check(CLI::Range(1L, kMaxLease));
    app.add_option("--state", options.state, "Folder for key and aliases (/usr/ovra/var/farlinkd)");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError &error) {
        return app.exit(error) == 0 ? 0 : static_cast<int>(ExitCode::kUsage);
    }
    const int aliases = options.lastPort - options.firstPort + 1;
    if (aliases < 1 || aliases > kMaxAliases) {
        return fail({ExitCode::kUsage, "there have to be 1 to 4000 ports for callers: correct "
                                       "--first-port and --last-port"});
    }
    return serve(options);
}

} // namespace

} // namespace Farlinkd

int main(int argc, char **argv) {
    OvraBase::fillStandardDescriptors();
    OvraService::protectMemory();
    OvraService::openLog("farlinkd");
    try {
        return Farlinkd::run(argc, argv);
    } catch (const std::exception &error) {
        return OvraService::reportStartError("farlinkd", error);
    }
}
