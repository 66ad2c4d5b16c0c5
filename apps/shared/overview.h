// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <json/value.h>

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

// Everything that this appliance knows of itself and of the nodes around it, as one document
// (OVRA.DR.Status overview; docs/wire.md describes its members).
namespace OvraApps {

/// How far the clocks of two appliances may be apart: one-time codes are accepted one step of 30
/// seconds early or late (RFC 6238, 5.2).
inline constexpr double kMaxClockSeconds = 30;

/// What the daemon learnt when it last asked over a credential. Times are seconds of the system
/// clock.
struct WayFacts {
    std::int64_t asked = 0;
    bool answers = false;      ///< a web API answered, if only with a refusal
    std::int64_t since = 0;    ///< since when that has been so, as often as it was asked
    std::int64_t lastSeen = 0; ///< when it last answered; 0: never
    double latency = -1;       ///< milliseconds of a small request, once it was known to answer
    int code = 0;              ///< why a request does not get through; 0: it does
    std::string reason;        ///< what the other end said to that
    std::string nodeId;        ///< who answered; "" if that was not said
    std::string version;
    std::optional<double> clockAhead; ///< of the clock there, in seconds
    std::optional<std::int64_t> ends; ///< when its session ends there, if it does
};

/// When a session that was granted here was last used, and from where.
struct SessionUse {
    std::int64_t last = 0;
    std::string client;
};

/// What only a running daemon knows.
struct DaemonFacts {
    std::int64_t since = 0;                 ///< when it started
    std::map<std::string, WayFacts> ways;   ///< by credential id
    std::map<std::string, SessionUse> uses; ///< by the reference of the session
};

struct OverviewRequest {
    static constexpr std::size_t kMaxPeers = 5000;

    /// The keys that this appliance shows over https and http; "" if they cannot be read.
    std::string httpsKey;
    std::string httpKey;
    std::string version;                 ///< of the program that asks
    const DaemonFacts *daemon = nullptr; ///< null: no daemon is asked, and what it knows is absent
    std::size_t offset = 0;              ///< of the first peer to describe
    std::size_t limit = 1000;            ///< of the peers to describe; kMaxPeers at most
};

/// Reads the stores and the caches, each once however many nodes there are, and sends nothing.
Json::Value makeOverview(const OverviewRequest &request);

/// A word as a shell takes it, quoted where that is needed: node ids come from others.
std::string shellWord(const std::string &word);

} // namespace OvraApps
