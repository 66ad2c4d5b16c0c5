// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/cred_errors.h"

namespace OvraPlatform {

const char *credErrorText(int error) {
    switch (static_cast<CredError>(error)) {
    case CredError::kNone:
        return "no error";
    case CredError::kBadArgument:
        return "the endpoint or the call is not valid: check protocol, host and port";
    case CredError::kOutOfMemory:
        return "no memory, descriptor, thread or local port is left here: end what takes them, or "
               "raise the limits";
    case CredError::kInternal:
        return "the request failed: the system log says why";
    case CredError::kNoPermission:
        return "the endpoint does not permit the request";
    case CredError::kCannotConnect:
        return "cannot connect: check name, address and port, and that the appliance runs";
    case CredError::kCertificateChanged:
        return "the endpoint's key is not the one trusted for it: find out why it changed, then "
               "run ovradr conn trust";
    case CredError::kReplyTooLarge:
        return "the reply is too large: ask for less at once";
    case CredError::kReplyBroken:
        return "the reply is not one of a web API: check that the port is the appliance's";
    case CredError::kConnectionLost:
        return "the connection ended before the reply was complete: check whether the request was "
               "carried out";
    case CredError::kTimedOut:
        return "no answer in time";
    case CredError::kHttpStatus:
        return "the endpoint answered with an HTTP error: check that the port is the appliance's";
    case CredError::kUploadUnreadable:
        return "the file cannot be sent: it must be a readable file, and go over https";
    case CredError::kSealFailed:
        return "the request could not be sealed: check that the endpoint is an appliance's";
    case CredError::kUnanswered:
        return "no answer in time: check whether the request was carried out";
    case CredError::kTlsTooOld:
        return "the endpoint speaks only versions of TLS that are broken (older than 1.2): update "
               "that appliance, or allow TLS 1.2 on it";
    case CredError::kReplyForged:
        return "the reply carries no valid seal, so somebody on the way may have changed it: use "
               "https, and check whether the request was carried out";
    case CredError::kTrustUnavailable:
        return "the file of trusted keys cannot be read or written: the system log says why";
    case CredError::kNotTrusted:
        return "the endpoint's key is not trusted yet, or no longer: run ovradr conn trust, and "
               "compare it with the one shown on that appliance";
    case CredError::kTrustLost:
        return "the file of trusted keys is missing or damaged and may have had a key of the "
               "endpoint: run ovradr doctor, then ovradr conn trust";
    }
    return "unknown error";
}

} // namespace OvraPlatform
