// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <json/value.h>

#include <string>
#include <utility>

namespace OvraPlatform {

/// The error codes of the web-API layer, local and remote. Peers compare the numbers: docs/wire.md.
namespace APIError {

enum Code : int {
    kInternal = 100,      ///< the handler failed, or the local daemon cannot be reached
    kBadRequest = 101,    ///< not a well-formed call
    kNoSuchAPI = 102,     ///< the appliance has no such API
    kNoSuchMethod = 103,  ///< the API has no such method
    kNoSuchVersion = 104, ///< the method has no such version
    kNoPermission = 105,  ///< the caller lacks the right; another credential may have it
    kBadParameter = 106,  ///< the message is an object: "param" names it, "text" says what is wrong
    kTooBusy = 107,       ///< nothing was done; a later try may succeed
    kTooLarge = 108,      ///< the request or its reply exceeds a limit
    kSealRefused = 109,   ///< the message is an object: "reason", "time" and "text"
    kNoSession = 119,     ///< the session is unknown or expired
    kLoginFailed = 400,   ///< no such account or wrong password
    kLoginDisabled = 401, ///< the account is disabled
    kLoginNotPermitted = 402,
    kLoginOtpRequired = 403,
    kLoginOtpWrong = 404,
};

} // namespace APIError

/// A success reply. \param data  an object, or null for a reply without data
inline Json::Value apiSuccess(Json::Value data = Json::Value()) {
    Json::Value reply(Json::objectValue);
    reply["success"] = true;
    if (!data.isNull()) {
        reply["data"] = std::move(data);
    }
    return reply;
}

/// An error reply. \param message  what was wrong and what to do; never anything secret
inline Json::Value apiError(int code, Json::Value message = Json::Value()) {
    Json::Value reply(Json::objectValue);
    reply["success"] = false;
    reply["error"]["code"] = code;
    if (!message.isNull()) {
        reply["error"]["msg"] = std::move(message);
    }
    return reply;
}

/// The error reply of a handler that cannot use the parameter `name`.
inline Json::Value apiBadParameter(const std::string &name, const std::string &text) {
    Json::Value message(Json::objectValue);
    message["param"] = name;
    message["text"] = text;
    return apiError(APIError::kBadParameter, message);
}

} // namespace OvraPlatform
