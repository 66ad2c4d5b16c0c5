// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/sealed_box.h"

#include <json/value.h>

#include <optional>
#include <string>

// The sending side of the sealed envelope.
namespace OvraPlatform {

UnixMillis wallClock();

/// Nothing when the text is no public key.
std::optional<PublicKey> parsePublicKey(const std::string &text);

/// Seals parameters and session id of `call` to `receiver`.
/// \param time      the receiver's time
/// \param replyKey  takes the key for the reply
/// \return the text of the field "sealed"; "" when libsodium cannot be used.
std::string sealRequest(const PublicKey &receiver, const WireCall &call, UnixMillis time,
                        ReplyKey &replyKey);

/// The document inside `reply` (an object with "sealed_reply"); nothing when it does not open.
std::optional<std::string> openReply(const ReplyKey &key, const Json::Value &reply);

} // namespace OvraPlatform
