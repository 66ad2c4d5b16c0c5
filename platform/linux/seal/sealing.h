// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/sealed_box.h"

#include <json/value.h>

#include <optional>
#include <string>

// The sending side of the sealed envelope.
namespace OvraPlatform {

UnixMillis wallClock();

/// std::nullopt if the text is not a public key.
std::optional<PublicKey> parsePublicKey(const std::string &text);

struct SealedRequest {
    std::string envelope; ///< the text of the field "sealed"
    ReplyKey replyKey;    ///< for the reply
};

/// Seals parameters and session id of `call` to `receiver`.
/// \param time  the receiver's time
/// \return std::nullopt if libsodium cannot be used.
[[nodiscard]] std::optional<SealedRequest> sealRequest(const PublicKey &receiver,
                                                       const WireCall &call, UnixMillis time);

/// The document inside `reply` (an object with "sealed_reply"); std::nullopt if it does not open.
[[nodiscard]] std::optional<std::string> openReply(const ReplyKey &key, const Json::Value &reply);

} // namespace OvraPlatform
