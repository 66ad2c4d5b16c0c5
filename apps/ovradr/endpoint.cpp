// SPDX-License-Identifier: Apache-2.0
#include "endpoint.h"

#include "provision/server_certificate.h"
#include "target.h"
#include "trust.h"

#include <ovracredential/cred_request.h>
#include <ovradrnode/sender.h>

#include <core/appliance.h>
#include <credential/sealed_box.h>

namespace Ovradr {

using OvraDRNode::Conn;

namespace {

constexpr long kReasonSeconds = 5;
constexpr int kProbe = 2;

/// Asks once more, to learn what the probe of the library leaves out.
Failure whyNotReachable(const Conn &conn) {
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

} // namespace

Expected<Conn> directEndpoint(const Conn &conn) {
    const Conn direct = Conn::translateFarlink(conn);
    if (!direct.isValid()) {
        return failure(ExitCode::kNotReachable,
                       "The relay service does not know " + targetText(conn) + ".",
                       "Check the alias, and that the relay service is set up here.");
    }
    return direct;
}

Trouble probeEndpoint(const Conn &conn) {
    return OvraDRNode::BaseSender::IsConnectable(conn) ? Trouble() : whyNotReachable(conn);
}

std::string ownFingerprint(const Conn &conn) {
    if (conn.protocol == "https") {
        return certificateFingerprint(OvraPlatform::kTlsCertificateFile);
    }
    std::string why;
    const auto keys = conn.protocol == "http"
                          ? OvraPlatform::SealKeyPair::load(OvraPlatform::kSealKeyFile, why)
                          : std::nullopt;
    return keys ? OvraPlatform::fingerprintOf(keys->publicKey()) : "";
}

} // namespace Ovradr
