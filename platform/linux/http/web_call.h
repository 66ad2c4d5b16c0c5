// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/http_connection.h"
#include "ovraplatform/sealed_box.h"
#include "ovraplatform/wire_form.h"

#include <ovradrcore/response.h>

#include <optional>
#include <string>

namespace OvraPlatform {

struct WebCallOptions {
    Deadline deadline;   ///< for everything together
    bool reuse = true;   ///< a kept connection may carry it, and it may be kept
    bool sealed = false; ///< seal the parameters also where TLS protects them
    std::optional<Upload> upload;
    /// Somebody logs in: the key of an endpoint that is unknown is trusted from now on.
    bool firstContact = false;
};

struct WebReply {
    std::string document;          ///< a reply document
    OvraDRCore::Response response; ///< what it says, valid
};

/// Calls a web API of a remote appliance and returns its reply document, opened if it was sealed.
///
/// Over plain http every call is sealed to the key that is trusted for the endpoint. A call
/// refused because the clocks differ, or because the appliance has a new key, is sealed again and
/// sent once more.
[[nodiscard]] CredExpected<WebReply> callWebAPI(const Endpoint &endpoint, const WireCall &call,
                                                const WebCallOptions &options);

/// The error of a question that had to be answered before a request could be sent.
inline CredError withoutRequest(CredError error) {
    return error == CredError::kUnanswered ? CredError::kTimedOut : error;
}

/// Checks without any secret or trust whether the entry point answers.
[[nodiscard]] CredExpected<void> probe(const Endpoint &endpoint, const std::string &url,
                                       Deadline deadline);

/// Asks the endpoint for the key that requests to it are sealed to. Over plain http the answer may
/// come from anybody; nothing is verified here.
[[nodiscard]] CredExpected<PublicKey> fetchSealKey(const Endpoint &endpoint,
                                                   const WebCallOptions &options);

} // namespace OvraPlatform
