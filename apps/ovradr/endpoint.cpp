// SPDX-License-Identifier: Apache-2.0
#include "endpoint.h"

#include "service/certificate.h"
#include "target.h"
#include "trust.h"

#include <ovracredential/cred_request.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/farlink.h>
#include <ovraplatform/sealed_box.h>

namespace Ovradr {

using OvraDRNode::Conn;

namespace {

constexpr long kReasonSeconds = 5;
constexpr int kProbe = 2;

/// Asks once more, to learn what the probe of the library leaves out.
Refusal whyNotReachable(const Conn &conn) {
    OVRA::CredRequest request;
    const bool answered =
        request.SetURL(conn.protocol, conn.addr, conn.port, "webapi/query.cgi") != 0 &&
        request.SetDefaultTimeout(kReasonSeconds) != 0 && request.Process(false, kProbe) != 0;
    if (answered) {
        return failure(ExitCode::kNotReachable,
                       targetText(conn) + " did not answer at first, but does now.", "Try again.");
    }
    return endpointFailure(conn, static_cast<OvraPlatform::CredError>(request.GetError()));
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
