// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "prompt.h"

#include <ovradrnode/conn.h>

#include <functional>
#include <string>

namespace CLI {
class App;
class Option;
} // namespace CLI

namespace Ovradr {

/// How a person logs in to another appliance.
struct RemoteLogin {
    std::string account;
    PasswordSource password;
    std::string oneTimeCode;
    bool askOneTimeCode = false;
};

/// --account, --password-file, --password-stdin, --otp and --otp-prompt; `login` has to live as
/// long as `command`. \return --account
CLI::Option *addRemoteLoginOptions(CLI::App &command, RemoteLogin &login);

/// --fingerprint; `fingerprint` has to live as long as `command`.
void addFingerprintOption(CLI::App &command, std::string &fingerprint);

/// Finds out where an endpoint is, and makes sure that its key is trusted, before anything secret
/// is sent to it.
/// \param conn         may be one of the relay service
/// \param fingerprint  the key that it must have, or ""
/// \return the direct endpoint
[[nodiscard]] Expected<OvraDRNode::Conn> meet(const OvraDRNode::Conn &conn,
                                              const std::string &fingerprint);

/// Logs in; answers with the library's error code, 0 when it succeeded.
using LoginAttempt = std::function<int(const std::string &password, const std::string &code)>;

/// Obtains password and one-time code and logs in with them. A one-time code that the other end
/// asks for is asked for here, once, where there is somebody to ask.
/// \param host  as the question names the other end
/// \return why there was no attempt, or no second one; what came of an attempt is not told.
[[nodiscard]] Expected<void> logIn(const RemoteLogin &login, const std::string &host,
                                   const LoginAttempt &attempt);

} // namespace Ovradr
