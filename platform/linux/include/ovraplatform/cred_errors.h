// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"

#include <tl/expected.hpp>

namespace OvraPlatform {

/// The error numbers of the credential request library, as returned by
/// OVRA::CredRequest::GetError(). 2, 4, 5, 6, 9, 10 and 15 are a contract with the node library;
/// the others tell failures apart.
enum class CredError : int {
    kNone = 0,
    kBadArgument = 1,        ///< an unusable endpoint, path or call
    kOutOfMemory = 2,        ///< no memory, descriptor, thread or local port is left here
    kInternal = 3,           ///< a failure without a number of its own
    kNoPermission = 4,       ///< HTTP status 401 or 403
    kCannotConnect = 5,      ///< no such name, refused, unreachable, or no TLS on that port
    kCertificateChanged = 6, ///< the endpoint's key is not the one trusted for it
    kReplyTooLarge = 7,      ///< over 8 MiB, or more JSON than OvraDRCore::JsonLimits
    kReplyBroken = 8,        ///< empty, not HTTP, or not a reply document
    kConnectionLost = 9,     ///< the connection ended before the reply was complete
    kTimedOut = 10,          ///< not done within the given time; nothing of the request was sent
    kHttpStatus = 11,        ///< an HTTP status that is not an answer
    kUploadUnreadable = 12,  ///< the file to send cannot be read, or cannot be sent as required
    kSealFailed = 13,        ///< the request could not be sealed
    kTrustUnavailable = 14,  ///< the file of trusted keys can be neither read nor written
    kUnanswered = 15,        ///< sent, and no answer in time: it may have been carried out
    kNotTrusted = 16,        ///< nobody has trusted a key of the endpoint yet, or it was withdrawn
    kTrustLost = 17,         ///< the file of trusted keys is missing or damaged
    kTlsTooOld = 18,         ///< the endpoint speaks no TLS 1.2 or newer
    kReplyForged = 19,       ///< the reply to a sealed request carries no valid seal
};

/// A value, or the error; never kNone.
template <typename T>
using CredExpected = tl::expected<T, CredError>;

/// Why the last log-in of this thread got no reply that can be believed; kNone if it got one. The
/// error 501 of the node library does not tell that from a wrong password.
OVRAPLATFORM_EXPORT CredError lastLoginError();

/// What the number means and what to do, for people; never null.
OVRAPLATFORM_EXPORT const char *credErrorText(int error);

} // namespace OvraPlatform
