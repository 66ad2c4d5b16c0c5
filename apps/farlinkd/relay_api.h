// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "alias_registry.h"
#include "service/http_server.h"
#include "service/rate_limit.h"
#include "service/work_queue.h"
#include "tunnel_server.h"

#include <ovrabase/secret.h>
#include <ovraplatform/farlink.h>
#include <ovraplatform/wire_form.h>

#include <json/value.h>
#include <sodium.h>

#include <array>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <map>
#include <mutex>
#include <string>
#include <vector>

namespace Farlinkd {

/// The calls of the relay service, and the appliances present; docs/wire.md describes both.
class RelayApi {
public:
    struct Settings {
        std::string address; ///< where the aliases' ports are opened; "": everywhere
        std::string host;    ///< told to callers; "": the one they use for the service
        int tunnelPort = 0;
    };

    /// What one client, one appliance and one question may take.
    struct Limits {
        std::size_t callsPerMinute = 3000; ///< a busy appliance polls once for each caller
        std::size_t proofsPerMinute = 30;
        std::size_t aliasesPerHour = 10;
        std::size_t callers = 64;           ///< of one appliance, not announced to it yet
        std::size_t callersOfOne = 32;      ///< those of them of one client
        std::chrono::seconds challenge{60}; ///< how long it can be answered
        std::chrono::seconds hold = OvraPlatform::kFarlinkHold; ///< of a poll without a caller
    };

    /// \param aliases  changed by this object alone from now on; must outlive it
    RelayApi(AliasRegistry &aliases, Settings settings, const Limits &limits);
    RelayApi(const RelayApi &) = delete;
    RelayApi &operator=(const RelayApi &) = delete;

    /// Opens the ports of the aliases in the book. The tunnelServer must outlive everything below.
    void connect(TunnelServer &tunnelServer);
    /// Handles one request; does not wait.
    void serve(OvraService::HttpRequest request, const OvraService::HttpServer::Answer &answer);
    /// Announces a caller to the appliance of the alias; false if it is not present.
    /// \param client  of the caller, see OvraBase::clientKey()
    [[nodiscard]] bool announce(const std::string &alias, const std::string &caller,
                                const std::string &client);
    /// Ends overdue polls for callers and expired aliases. Call it now and then.
    void endOverdue();
    /// Drops waiting requests, and waits for those in progress.
    void stop();

private:
    using Clock = std::chrono::steady_clock;
    using Answer = OvraService::HttpServer::Answer;

    struct Caller {
        std::string id;
        std::string client;
    };
    /// An appliance that has proved its ownership of an alias.
    struct Agent {
        std::string token;
        Clock::time_point seen;
        std::vector<Caller> callers; ///< not announced to it yet
        Answer waiting;              ///< its poll, held back until there is a caller
        Clock::time_point waitingSince;
    };

    void handle(OvraService::HttpRequest &request, const Answer &answer);
    Json::Value lookUp(const Json::Value &params);
    Json::Value challenge(const Json::Value &params, const std::string &address);
    bool isProved(const Json::Value &params) const;
    Json::Value enrol(const Json::Value &params, const std::string &address);
    Json::Value release(const Json::Value &params);
    void dropExpired();
    void wait(const Json::Value &params, const Answer &answer);

    std::string challengeFor(const std::string &alias, const std::string &key,
                             std::int64_t time) const;
    bool isFresh(const std::string &challenge, const std::string &alias,
                 const std::string &key) const;
    Agent *agentOf(const Json::Value &params);
    bool isThere(const Agent &agent) const;
    static void deliverCallers(Agent &agent, const Answer &answer);
    [[nodiscard]] bool openPort(const Alias &alias);
    void leave(const std::string &alias);

    const Settings settings_;
    const Limits limits_;
    AliasRegistry &aliases_; ///< changed by the jobs of changes_ alone
    TunnelServer *tunnelServer_ = nullptr;
    /// Proves that a challenge is ours without storing it.
    OvraBase::SecretBytes<crypto_auth_KEYBYTES> secret_;
    std::mutex mutex_; ///< of the agents and limits; never held while the disk is waited for
    std::map<std::string, Agent> agents_;
    OvraService::RateLimit calls_;
    OvraService::RateLimit proofs_;
    OvraService::RateLimit newAliases_;
    std::atomic<bool> dropping_ = false; ///< expired aliases; queued or in progress
    // Last, so that they are destroyed first: their jobs use everything above. One thread makes the
    // changes, which wait for the disk; nothing else does.
    OvraService::WorkQueue changes_{1, {512, 64}};
    OvraService::WorkQueue queue_{2, {1024, 512}};
};

} // namespace Farlinkd
