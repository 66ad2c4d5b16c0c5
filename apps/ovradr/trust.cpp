// SPDX-License-Identifier: Apache-2.0
#include "trust.h"

#include "endpoint.h"
#include "node_ref.h"
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

Refusal keyFailure(const Conn &conn, const PeerIdentity &identity, const std::string &what,
                   const std::string &hint) {
    return failure(
        ExitCode::kCertificate,
        "The key of " + targetText(conn) + ", " + identity.fingerprint + ", " + what + ".", hint);
}

Refusal changedKey(const Conn &conn, const PeerIdentity &identity) {
    return keyFailure(conn, identity, "is not the one that was trusted for it",
                      "Somebody may be in between. When you know that the key was changed, run "
                      "`ovradr conn trust " +
                          targetText(conn) + "`.");
}

/// What is known of an endpoint whose key a person has to judge.
const char *standing(TrustVerdict verdict) {
    switch (verdict) {
    case TrustVerdict::kTrusted:
        return "is trusted already";
    case TrustVerdict::kForgotten:
        return "was forgotten";
    case TrustVerdict::kLost:
        return "may have been lost with the file of trusted keys";
    case TrustVerdict::kDifferent:
    case TrustVerdict::kVouched:
        return "is another one than before";
    default:
        return "is not known yet";
    }
}

} // namespace

void endLossOfKeys() {
    OvraPlatform::TrustStore store;
    if (store.problem().empty()) {
        return;
    }
    const auto creds = allCredentials();
    if (creds && std::all_of(creds->begin(), creds->end(), [&store](const auto &record) {
            const Conn &conn = record.conn;
            return store.find(OvraPlatform::trustKey(conn.protocol, conn.addr, conn.port))
                .has_value();
        })) {
        (void)store.create(); // else it stays as it is, and `ovradr doctor` says so
    }
}

bool askWhetherToTrust(const Conn &conn, const PeerIdentity &identity, const char *shown) {
    std::fprintf(stderr, "The key of %s %s. It shows now:\n  %s\nCompare that with what %s.\n",
                 printable(targetText(conn)).c_str(), standing(identity.pinned),
                 identity.fingerprint.c_str(), shown);
    return confirm("Is it the same?");
}

Refusal nobodyToAsk(const Conn &conn, const PeerIdentity &identity, const char *shown) {
    return keyFailure(
        conn, identity, std::string(standing(identity.pinned)) + ", and nobody can be asked",
        std::string("Compare it with what ") + shown + ", and give it with --fingerprint.");
}

Refusal notNamed(const Conn &conn, const PeerIdentity &identity) {
    return keyFailure(conn, identity, "is not the one that --fingerprint names",
                      "Do not go on before you know why.");
}

Refusal notTrusted(const Conn &conn, const PeerIdentity &identity) {
    return keyFailure(conn, identity, "was not trusted", "Nothing was sent to it.");
}

std::string checkFingerprint(const std::string &text) {
    return OvraBase::isFingerprint(text) ? ""
                                         : "a fingerprint is SHA256: and 43 characters of base64";
}

Refusal endpointFailure(const Conn &conn, CredError error) {
    if (error == CredError::kCannotConnect) {
        return whyNotReachable(conn);
    }
    // The sentence of the library says what is wrong and, behind a colon, what to do.
    const std::string text = OvraPlatform::credErrorText(static_cast<int>(error));
    const std::size_t colon = text.find(": ");
    std::string hint = colon == std::string::npos ? "" : text.substr(colon + 2) + ".";
    if (!hint.empty()) {
        hint.front() = static_cast<char>(std::toupper(static_cast<unsigned char>(hint.front())));
    } else {
        hint = "`ovradr doctor " + targetText(conn) + "` shows each step on the way.";
    }
    return failure(exitOf(error), targetText(conn) + ": " + text.substr(0, colon) + ".", hint);
}

std::string trustWord(const PeerIdentity &identity) {
    if (identity.isTrusted()) {
        return identity.pinned == TrustVerdict::kTrusted ? "pinned" : "system";
    }
    if (identity.isChanged()) {
        return "changed";
    }
    switch (identity.pinned) {
    case TrustVerdict::kForgotten:
        return "forgotten";
    case TrustVerdict::kLost:
        return "lost";
    case TrustVerdict::kUnavailable:
    case TrustVerdict::kShortage:
        return "unavailable";
    default:
        return "unknown";
    }
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
    if (word == "changed") {
        return identity.pinned == TrustVerdict::kVouched
                   ? "no, this system's certificates vouched for it before and do not now"
                   : "no, another key is known";
    }
    if (word == "forgotten") {
        return "no, its key was forgotten";
    }
    return word == "lost" ? "no, the file of trusted keys is damaged or missing"
                          : "the known keys cannot be read";
}

Expected<void> trustPeer(const Conn &conn, const std::string &expected, const char *shown) {
    const auto met =
        OvraPlatform::peerFingerprint(conn.protocol, conn.addr, conn.port, kKeySeconds);
    if (!met) {
        return endpointFailure(conn, met.error());
    }
    const PeerIdentity &identity = *met;
    if (!expected.empty() && identity.fingerprint != expected) {
        return notNamed(conn, identity);
    }
    if (identity.isChanged()) {
        return changedKey(conn, identity);
    }
    if (trustWord(identity) == "unavailable") {
        return endpointFailure(conn, CredError::kTrustUnavailable);
    }
    // A key that is named is pinned, whoever else vouches for it.
    if (identity.pinned == TrustVerdict::kTrusted || (expected.empty() && identity.isTrusted())) {
        return {};
    }
    if (expected.empty() && !isInteractive()) {
        return nobodyToAsk(conn, identity, shown);
    }
    if (expected.empty() && !askWhetherToTrust(conn, identity, shown)) {
        return notTrusted(conn, identity);
    }
    switch (
        OvraPlatform::trustEndpoint(conn.protocol, conn.addr, conn.port, identity.fingerprint)) {
    case TrustVerdict::kTrusted:
        endLossOfKeys();
        return {};
    case TrustVerdict::kDifferent:
        return changedKey(conn, identity);
    default:
        return endpointFailure(conn, CredError::kTrustUnavailable);
    }
}

} // namespace Ovradr
