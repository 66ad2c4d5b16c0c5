// SPDX-License-Identifier: Apache-2.0
#include "trust.h"

#include "output.h"
#include "prompt.h"
#include "target.h"

#include <ovrabase/encoding.h>

#include <algorithm>
#include <cctype>
#include <cstdio>

namespace Ovradr {

namespace {

using OvraDRNode::Conn;
using OvraPlatform::CredError;
using OvraPlatform::PeerIdentity;
using OvraPlatform::TrustVerdict;

ExitCode exitOf(CredError error) {
    switch (error) {
    case CredError::kBadArgument:
        return ExitCode::kUsage;
    case CredError::kNoPermission:
        return ExitCode::kNotPermitted;
    case CredError::kCannotConnect:
    case CredError::kConnectionLost:
    case CredError::kTimedOut:
    case CredError::kHttpStatus:
    case CredError::kReplyBroken:
    case CredError::kReplyTooLarge:
    case CredError::kTlsTooOld:
        return ExitCode::kNotReachable;
    case CredError::kCertificateChanged:
        return ExitCode::kCertificate;
    case CredError::kTrustUnavailable:
        return ExitCode::kNotSetUp;
    default:
        return ExitCode::kFailed;
    }
}

Refusal keyFailure(const Conn &conn, const PeerIdentity &identity, const std::string &what,
                   const std::string &hint) {
    return failure(
        ExitCode::kCertificate,
        "The key of " + targetText(conn) + ", " + identity.fingerprint + ", " + what + ".", hint);
}

Refusal changedKey(const Conn &conn, const PeerIdentity &identity) {
    return keyFailure(conn, identity, "is not the one that was trusted for it",
                      "Somebody may be in between. When you know that the key was changed, run "
                      "`ovradr conn forget " +
                          targetText(conn) + "` and try again.");
}

bool askWhetherToTrust(const Conn &conn, const PeerIdentity &identity) {
    std::fprintf(stderr, "The key of %s is not known yet:\n  %s\n",
                 printable(targetText(conn)).c_str(), identity.fingerprint.c_str());
    return confirm("`ovradr conn local` over there shows the same. Trust this key?");
}

Expected<void> pin(const Conn &conn, const PeerIdentity &identity) {
    switch (OvraPlatform::expectFingerprint(conn.protocol, conn.addr, conn.port,
                                            identity.fingerprint)) {
    case TrustVerdict::kTrusted:
        return {};
    case TrustVerdict::kDifferent:
        return changedKey(conn, identity);
    default:
        return endpointFailure(conn, CredError::kTrustUnavailable);
    }
}

} // namespace

std::string checkFingerprint(const std::string &text) {
    return OvraBase::isFingerprint(text) ? ""
                                         : "a fingerprint is SHA256: and 43 characters of base64";
}

Refusal endpointFailure(const Conn &conn, CredError error) {
    // The sentence of the library says what is wrong and, behind a colon, what to do.
    const std::string text = OvraPlatform::credErrorText(static_cast<int>(error));
    const std::size_t colon = text.find(": ");
    std::string hint = colon == std::string::npos ? "" : text.substr(colon + 2) + ".";
    if (!hint.empty()) {
        hint.front() = static_cast<char>(std::toupper(static_cast<unsigned char>(hint.front())));
    } else {
        hint = "Check name, address and port, and that the appliance runs.";
    }
    return failure(exitOf(error), targetText(conn) + ": " + text.substr(0, colon) + ".", hint);
}

std::string trustWord(const PeerIdentity &identity) {
    if (identity.acceptedBySystem) {
        return "system";
    }
    switch (identity.pinned) {
    case TrustVerdict::kTrusted:
        return "pinned";
    case TrustVerdict::kUnknown:
        return "unknown";
    case TrustVerdict::kDifferent:
        return "changed";
    case TrustVerdict::kUnavailable:
        break;
    }
    return "unavailable";
}

std::string trustText(const PeerIdentity &identity) {
    const std::string word = trustWord(identity);
    if (word == "system") {
        return "yes, by the certificates that this system trusts";
    }
    if (word == "pinned") {
        return "yes, it is the known key";
    }
    if (word == "unknown") {
        return "not yet";
    }
    return word == "changed" ? "no, another key is known" : "the known keys cannot be read";
}

Expected<void> trustPeer(const Conn &conn, const std::string &expected) {
    const auto met =
        OvraPlatform::peerFingerprint(conn.protocol, conn.addr, conn.port, kKeySeconds);
    if (!met) {
        return endpointFailure(conn, met.error());
    }
    const PeerIdentity &identity = *met;
    if (!expected.empty() && identity.fingerprint != expected) {
        return keyFailure(conn, identity, "is not the one that --fingerprint names",
                          "Do not go on before you know why.");
    }
    if (identity.acceptedBySystem || identity.pinned == TrustVerdict::kTrusted) {
        return {};
    }
    if (identity.pinned == TrustVerdict::kDifferent) {
        return changedKey(conn, identity);
    }
    if (identity.pinned == TrustVerdict::kUnavailable) {
        return endpointFailure(conn, CredError::kTrustUnavailable);
    }
    if (expected.empty() && !isInteractive()) {
        return keyFailure(conn, identity, "is not trusted yet, and nobody can be asked",
                          "Compare it with what `ovradr conn local` shows over there, and give it "
                          "with --fingerprint.");
    }
    if (expected.empty() && !askWhetherToTrust(conn, identity)) {
        return keyFailure(conn, identity, "was not trusted", "Nothing was sent to it.");
    }
    return pin(conn, identity);
}

} // namespace Ovradr
