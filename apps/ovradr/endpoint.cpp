// SPDX-License-Identifier: Apache-2.0
#include "endpoint.h"

#include "service/certificate.h"
#include "target.h"
#include "tcp_reach.h"
#include "trust.h"

#include <ovracredential/cred_request.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/farlink.h>
#include <ovraplatform/sealed_box.h>

#include <chrono>

namespace Ovradr {

using OvraDRNode::Conn;
using OvraPlatform::CredError;

namespace {

constexpr std::chrono::seconds kLookTime{4}; // after 3 the kernel says that nobody has the address
constexpr long kProbeSeconds = 5;
constexpr int kProbe = 2;

std::string doctorHint(const Conn &conn) {
    return "`ovradr doctor " + targetText(conn) + "` shows each step on the way.";
}

Refusal notReachable(const Conn &conn, const std::string &message, const std::string &advice) {
    return failure(ExitCode::kNotReachable, message,
                   advice + (advice.empty() ? "" : " ") + doctorHint(conn));
}

/// What is said by an endpoint that takes connections.
Refusal whyNoAnswer(const Conn &conn) {
    OVRA::CredRequest request;
    const bool answered =
        request.SetURL(conn.protocol, conn.addr, conn.port, "webapi/query.cgi") != 0 &&
        request.SetDefaultTimeout(kProbeSeconds) != 0 && request.Process(false, kProbe) != 0;
    if (answered) {
        return failure(ExitCode::kNotReachable,
                       targetText(conn) + " did not answer at first, but does now.", "Try again.");
    }
    switch (const auto error = static_cast<CredError>(request.GetError())) {
    case CredError::kCannotConnect:
    case CredError::kConnectionLost:
        return notReachable(conn,
                            targetText(conn) + " takes connections, but does not speak " +
                                (conn.protocol == "http" ? "HTTP" : "HTTPS") + ".",
                            "Check protocol and port: HTTPS is 5001, HTTP 5000 as a rule.");
    case CredError::kTimedOut:
    case CredError::kUnanswered:
        return notReachable(conn,
                            targetText(conn) + " takes connections, but does not answer in time.",
                            "It may be overloaded, or something else may listen there.");
    default:
        return endpointFailure(conn, error);
    }
}

/// The relay service of this appliance.
Expected<OvraPlatform::FarlinkSettings> relay() {
    auto settings = OvraPlatform::readFarlinkSettings();
    if (!settings || settings->host.empty()) {
        return failure(ExitCode::kNotReachable, "No relay service is set up on this appliance.",
                       "Run `ovradr farlink enable --server URL`.");
    }
    return *settings;
}

} // namespace

Expected<Conn> directEndpoint(const Conn &conn) {
    if (!conn.isFarlink()) {
        return conn;
    }
    return relay().and_then([&conn](const auto &) {
        const Conn direct = Conn::translateFarlink(conn);
        return direct.isValid()
                   ? Expected<Conn>(direct)
                   : failure(ExitCode::kUsage, targetText(conn) + " cannot be an alias.",
                             "An alias has 3 to 63 letters, digits and inner hyphens.");
    });
}

Expected<Conn> placeOf(const Conn &conn) {
    if (!conn.isFarlink()) {
        return conn;
    }
    return relay().and_then([&conn](const auto &settings) -> Expected<Conn> {
        const auto place = OvraPlatform::FarlinkClient(settings).lookUp(conn.addr);
        if (place) {
            return Conn::https(place->host, place->port);
        }
        return failure(ExitCode::kNotReachable,
                       targetText(conn) + " is not reached through " + settings.host + ": " +
                           place.error().text + ".",
                       "`ovradr farlink status`, here and over there, says more.");
    });
}

Refusal whyNotReachable(const Conn &conn) {
    const Expected<Conn> place =
        parseTarget(targetText(conn)).and_then([](const Conn &named) { return placeOf(named); });
    if (!place) {
        return Refusal(place.error()); // the relay service knows
    }
    const auto connected =
        resolveHost(place->addr, place->port, kLookTime).and_then([&](const auto &addresses) {
            return connectAny(addresses, *place, kLookTime);
        });
    return connected ? whyNoAnswer(conn)
                     : notReachable(conn, connected.error().message, connected.error().hint);
}

Expected<void> probeEndpoint(const Conn &conn) {
    return OvraDRNode::BaseSender::IsConnectable(conn) ? Expected<void>() : whyNotReachable(conn);
}

std::string ownFingerprint(const Conn &conn) {
    if (conn.protocol == "https" || conn.isFarlink()) { // the relay service only passes it on
        return OvraService::certificateFingerprint(OvraPlatform::kTlsCertificateFile);
    }
    if (conn.protocol != "http") {
        return "";
    }
    const auto keys = OvraPlatform::SealKeyPair::load(OvraPlatform::kSealKeyFile);
    return keys ? OvraPlatform::fingerprintOf(keys->publicKey()) : "";
}

} // namespace Ovradr
