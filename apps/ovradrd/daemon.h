// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/http_server.h"
#include "service/startup.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
#include <vector>

namespace Ovradrd {

/// Where the daemon serves.
struct Settings {
    std::vector<std::string> addresses; ///< numeric; empty: every address of the machine
    int httpPort = 0;                   ///< 0: any free port
    int httpsPort = 0;
    OvraService::HttpLimits limits;
    std::size_t testFiles = 16; ///< sent at the same time
    bool logsCalls = false;     ///< every call, at level debug
};

/// The whole daemon: web server, local socket, queues and handlers. One per process.
class Daemon {
public:
    /// How long calls in progress may continue once the daemon stops.
    static constexpr std::chrono::milliseconds kGrace{2500};

    explicit Daemon(Settings settings);
    Daemon(const Daemon &) = delete;
    Daemon &operator=(const Daemon &) = delete;
    /// Stops, and waits for the calls still in progress.
    ~Daemon();

    /// Loads what `ovradr setup` created, binds the ports and begins to serve.
    [[nodiscard]] tl::expected<void, OvraService::StartError> start();
    /// The ports that it serves on, once started.
    int httpsPort() const;
    int httpPort() const;

    /// Takes over what may change while it serves: the TLS key and certificate, for new
    /// connections. \param settings  as they are now \return whether they name other addresses or
    /// ports than those served, which takes a restart;
    ///         an error if key and certificate cannot be used: then those from before stay
    [[nodiscard]] OvraBase::Expected<bool> reload(const Settings &settings);

    /// The periodic work of every few seconds: sweeps expired sessions and has pending releases
    /// tried. Returns at once.
    void doPeriodicWork();

    /// Ends serving: calls in progress get kGrace, then the connections of remote callers end
    /// without an answer, and local callers are told that the daemon stops.
    /// \return false if calls still run (they wait for another appliance): the process may then
    ///         only leave with _exit(2), at once.
    bool stop();

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace Ovradrd
