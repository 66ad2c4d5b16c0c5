// SPDX-License-Identifier: Apache-2.0

// farlinkd: the relay service, by which appliances without a way in are reached under an alias.

#include "alias_book.h"
#include "desk.h"
#include "http_server.h"
#include "listener.h"
#include "provision/server_certificate.h"
#include "switchboard.h"
#include "tls_identity.h"

#include <ovracore/ovracore.h>
#include <ovradrcore/log.h>

#include <CLI/CLI.hpp>
#include <core/appliance.h>
#include <credential/farlink.h>
#include <sys/resource.h>
#include <syslog.h>

#include <array>
#include <csignal>
#include <cstdio>
#include <exception>
#include <optional>
#include <string>

namespace Farlinkd {

namespace {

constexpr rlim_t kDescriptors = 16384;
constexpr int kHighestPort = 65535;
constexpr int kMostAliases = 4000; // what fits into the file of aliases, with room to spare
constexpr timespec kTick{1, 0};

enum class Outcome : int { kOk = 0, kFailed = 1, kUsage = 2, kPortInUse = 3 };

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

Outcome fail(Outcome outcome, const std::string &why) {
    OVRA_ERR("farlinkd does not start: %s", why.c_str());
    std::fprintf(stderr, "farlinkd: %s\n", why.c_str());
    return outcome;
}

void raiseDescriptorLimit() {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0 && limit.rlim_cur < kDescriptors) {
        limit.rlim_cur =
            limit.rlim_max == RLIM_INFINITY ? kDescriptors : std::min(kDescriptors, limit.rlim_max);
        setrlimit(RLIMIT_NOFILE, &limit);
    }
}

std::string ownName() {
    std::array<char, 256> name{};
    return OVRALnxGetHostname(name.data(), static_cast<int>(name.size())) > 0 ? name.data()
                                                                              : "farlinkd";
}

/// The key and certificate of the service, made when there are none.
/// \param why  takes one sentence when nothing is returned
std::optional<Ovradrd::TlsIdentity> identityIn(const Options &options, std::string &fingerprint,
                                               std::string &why) {
    const std::string key = options.state + "/farlinkd.key";
    const std::string certificate = options.state + "/farlinkd.crt";
    if (!OvraPlatform::ensureStateDir(options.state)) {
        why = options.state + " cannot be made or is not this user's alone: name another folder "
                              "with --state";
        return std::nullopt;
    }
    const Ovradr::ServerNames names{options.host.empty() ? ownName() : options.host, {}};
    for (const auto &step :
         {Ovradr::provisionTlsKey(key), Ovradr::provisionCertificate(certificate, key, names)}) {
        if (!step) {
            why = step.failure().message;
            return std::nullopt;
        }
    }
    fingerprint = Ovradr::certificateFingerprint(certificate);
    return Ovradrd::TlsIdentity::load(key, certificate, why);
}

void waitForEnd(const sigset_t &signals, Desk &desk) {
    while (sigtimedwait(&signals, nullptr, &kTick) < 0) {
        desk.tick();
    }
}

Outcome serve(const Options &options) {
    std::signal(SIGPIPE, SIG_IGN);
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : {SIGTERM, SIGINT, SIGHUP}) {
        sigaddset(&signals, signal);
    }
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    raiseDescriptorLimit();

    std::string why;
    std::string fingerprint;
    const auto identity = identityIn(options, fingerprint, why);
    AliasBook book(options.state + "/aliases", {options.firstPort, options.lastPort,
                                                std::chrono::seconds(options.leaseSeconds)});
    if (!identity || !book.load(why)) {
        return fail(Outcome::kFailed, why);
    }
    std::vector<Ovradrd::Listener> https;
    https.push_back(Ovradrd::Listener::listen(options.address, options.port));
    Ovradrd::Listener tunnel = Ovradrd::Listener::listen(options.address, options.tunnelPort);
    for (const Ovradrd::Listener *listener : {&https.front(), &tunnel}) {
        if (listener->problem != Ovradrd::Listener::Problem::kNone) {
            return fail(listener->problem == Ovradrd::Listener::Problem::kPortInUse
                            ? Outcome::kPortInUse
                            : Outcome::kFailed,
                        listener->why);
        }
    }
    const int port = https.front().port;
    const int tunnelPort = tunnel.port;

    Desk desk(std::move(book), {options.address, options.host, tunnelPort});
    Switchboard switchboard([&desk](const std::string &alias,
                                    const std::string &caller) { return desk.ring(alias, caller); },
                            {});
    Ovradrd::HttpLimits limits;
    limits.connections.total = 4096;
    limits.files = 0;
    Ovradrd::HttpServer http(
        [&desk](Ovradrd::HttpRequest request, const Ovradrd::HttpServer::Answer &answer) {
            desk.serve(std::move(request), answer);
        },
        limits);
    if (!switchboard.start(std::move(tunnel), why)) {
        return fail(Outcome::kFailed, why);
    }
    desk.connect(switchboard);
    if (!http.start(std::move(https), {}, *identity, why)) {
        return fail(Outcome::kFailed, why);
    }
    OVRA_NOTICE("Serves at port [%d], for appliances at port [%d], for callers at ports [%d-%d]",
                port, tunnelPort, options.firstPort, options.lastPort);
    std::printf("farlinkd: ready, https %d, tunnels %d, aliases %d-%d\nfarlinkd: key %s\n", port,
                tunnelPort, options.firstPort, options.lastPort, fingerprint.c_str());
    std::fflush(stdout);

    waitForEnd(signals, desk);
    OVRA_NOTICE("Stops");
    http.quiesce();
    desk.stop();
    http.stop();
    return Outcome::kOk;
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
        ->check(CLI::Range(0, kHighestPort));
    app.add_option("--tunnel-port", options.tunnelPort, "Port for the appliances (5444)")
        ->check(CLI::Range(0, kHighestPort));
    app.add_option("--first-port", options.firstPort,
                   "First port for callers, one an alias (20000)")
        ->check(CLI::Range(1, kHighestPort));
    app.add_option("--last-port", options.lastPort, "Last one (20999)")
        ->check(CLI::Range(1, kHighestPort));
    app.add_option("--lease", options.leaseSeconds,
                   "Seconds for which an alias stays its owner's when that is gone (30 days)")
        ->check(CLI::PositiveNumber);
    app.add_option("--state", options.state, "Folder for key and aliases (/usr/ovra/var/farlinkd)");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError &error) {
        return app.exit(error) == 0 ? 0 : static_cast<int>(Outcome::kUsage);
    }
    const int aliases = options.lastPort - options.firstPort + 1;
    if (aliases < 1 || aliases > kMostAliases) {
        return static_cast<int>(fail(Outcome::kUsage,
                                     "there have to be 1 to 4000 ports for callers: correct "
                                     "--first-port and --last-port"));
    }
    return static_cast<int>(serve(options));
}

} // namespace

} // namespace Farlinkd

int main(int argc, char **argv) {
    openlog("farlinkd", LOG_NDELAY, LOG_DAEMON);
    try {
        return Farlinkd::run(argc, argv);
    } catch (const std::exception &error) {
        return static_cast<int>(Farlinkd::fail(Farlinkd::Outcome::kFailed, error.what()));
    }
}
