// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovradrnode/conn.h>
#include <ovraplatform/peer_trust.h>

#include <string>

namespace Ovradr {

/// How long to wait for an endpoint to show its key, in seconds.
inline constexpr long kKeySeconds = 10;

/// For command lines: "" if the text is a fingerprint ("SHA256:" and 43 characters of base64, as
/// setup and `conn local` show it), otherwise what is wrong.
std::string checkFingerprint(const std::string &text);

/// Why an endpoint could not be contacted.
/// \param error  a number of the credential request library
Refusal endpointFailure(const OvraDRNode::Conn &conn, OvraPlatform::CredError error);

/// What is known about the key that the endpoint shows, for people.
std::string trustText(const OvraPlatform::PeerIdentity &identity);
/// The same as one word for scripts.
std::string trustWord(const OvraPlatform::PeerIdentity &identity);

/// Where a person sees the key that an endpoint has to show.
inline constexpr const char *kShownByAppliance = "`ovradr conn local` prints on that appliance";
inline constexpr const char *kShownByRelay = "farlinkd prints when it starts";

/// Shows a person the key of an endpoint, which nobody has checked, and asks whether it is the one
/// that is shown over there. Only where isInteractive().
bool askWhetherToTrust(const OvraDRNode::Conn &conn, const OvraPlatform::PeerIdentity &identity,
                       const char *shown = kShownByAppliance);

/// Why a key is not trusted: a person is needed; it is not the named one; the person said no.
Refusal nobodyToAsk(const OvraDRNode::Conn &conn, const OvraPlatform::PeerIdentity &identity,
                    const char *shown = kShownByAppliance);
Refusal notNamed(const OvraDRNode::Conn &conn, const OvraPlatform::PeerIdentity &identity);
Refusal notTrusted(const OvraDRNode::Conn &conn, const OvraPlatform::PeerIdentity &identity);

/// After a person trusted a key: once one is known for every endpoint of a credential, no key is
/// taken for lost any more with a file of trusted keys that was.
void endLossOfKeys();

/// Makes sure that the key of a direct endpoint is trusted before anything secret is sent to it. A
/// key that is not known is trusted if it is the expected one, or if the user at the terminal
/// confirms it; an expected one is pinned whoever else vouches for it. Another key than the known
/// one is refused.
/// \param expected  the required fingerprint, or ""
/// \param shown     where a person finds it
/// \return success if the key is trusted, else what is in the way.
[[nodiscard]] Expected<void> trustPeer(const OvraDRNode::Conn &conn, const std::string &expected,
                                       const char *shown = kShownByAppliance);

} // namespace Ovradr
