// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "alias_book.h"
#include "http_server.h"
#include "lanes.h"
#include "rate_limit.h"
#include "switchboard.h"

#include <credential/encoding.h>
#include <credential/wire_form.h>
#include <json/value.h>

#include <array>
#include <chrono>
#include <deque>
#include <map>
#include <mutex>
#include <string>

namespace Farlinkd {

/// The calls of the relay service, and which appliances are there; docs/wire.md describes both.
class Desk {
public:
    struct Settings {
        std::string address; ///< where the aliases' ports are opened; "": everywhere
        std::string host;    ///< that callers are told; "": the one they know the service by
        int tunnelPort = 0;
    };

    Desk(AliasBook book, Settings settings);
    Desk(const Desk &) = delete;
    Desk &operator=(const Desk &) = delete;

    /// Opens the ports of the aliases in the book. The switchboard has to outlive everything below.
    void connect(Switchboard &switchboard);
    /// Carries out one request; does not wait.
    void serve(Ovradrd::HttpRequest request, const Ovradrd::HttpServer::Answer &answer);
    /// Tells the appliance of the alias about a caller; false when it is not there.
    bool ring(const std::string &alias, const std::string &caller);
    /// Ends what has lasted long enough: questions for callers, and aliases. Now and then.
    void tick();
    /// Drops the requests that wait, and waits for those under way.
    void stop();

private:
    using Clock = std::chrono::steady_clock;
    using Answer = Ovradrd::HttpServer::Answer;

    /// An appliance that has proved whose alias it is.
    struct Agent {
        std::string token;
        Clock::time_point seen;
        std::deque<std::string> callers; ///< that it was not told about yet
        Answer waiting;                  ///< its question, held back until there is a caller
        Clock::time_point waitingSince;
    };

    void handle(Ovradrd::HttpRequest &request, const Answer &answer);
    Json::Value lookUp(const Json::Value &params);
    Json::Value challenge(const Json::Value &params, const std::string &address);
    Json::Value enrol(const Json::Value &params, const std::string &address);
    Json::Value release(const Json::Value &params);
    void wait(const Json::Value &params, const Answer &answer);

    std::string challengeFor(const std::string &alias, const std::string &key,
                             std::int64_t time) const;
    bool isFresh(const std::string &challenge, const std::string &alias,
                 const std::string &key) const;
    Agent *agentOf(const Json::Value &params);
    bool isThere(const Agent &agent) const;
    static void tellCallers(Agent &agent, const Answer &answer);
    bool openPort(const Alias &alias);
    void leave(const std::string &alias);

    Settings settings_;
    Switchboard *switchboard_ = nullptr;
    /// Proves that a challenge is one of ours without remembering it.
    OvraPlatform::SecretBytes<crypto_auth_KEYBYTES> secret_;
    std::mutex mutex_; ///< of everything below
    AliasBook book_;
    std::map<std::string, Agent> agents_;
    RateLimit calls_;
    RateLimit proofs_;
    RateLimit newAliases_;
    // Last, so that it goes first: its jobs use everything above.
    Ovradrd::Lane lane_{2, 512};
};

} // namespace Farlinkd
