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

/// --account, --password-file, --password-stdin, --otp and --otp-prompt; `login` must outlive
/// `command`. \return --account
CLI::Option *addRemoteLoginOptions(CLI::App &command, RemoteLogin &login);

/// --otp, without the blanks in what is given; `code` must outlive `command`.
CLI::Option *addOneTimeCodeOption(CLI::App &command, std::string &code);

/// --fingerprint; `fingerprint` must outlive `command`.
CLI::Option *addFingerprintOption(CLI::App &command, std::string &fingerprint);

/// Makes sure that the key of an endpoint is trusted before anything secret is sent to it.
/// \param conn         may be a relay endpoint
/// \param fingerprint  the required key, or ""
[[nodiscard]] Expected<void> trustedEndpoint(const OvraDRNode::Conn &conn,
                                             const std::string &fingerprint);

/// Logs in; returns the library's error code, 0 on success.
using LoginAttempt = std::function<int(const std::string &password, const std::string &code)>;

/// Obtains password and one-time code and logs in with them. If the other end requires a one-time
/// code, prompts for it once where that is possible.
/// \param host  the other end's name in the prompt
/// \return why there was no attempt, or no second one; does not report the result of an attempt.
[[nodiscard]] Expected<void> logIn(const RemoteLogin &login, const std::string &host,
                                   const LoginAttempt &attempt);

} // namespace Ovradr
