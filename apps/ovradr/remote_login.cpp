// SPDX-License-Identifier: Apache-2.0
#include "remote_login.h"

#include "commands/commands.h"
#include "endpoint.h"
#include "trust.h"
#include "usage.h"

#include <ovradrcore/err_recorder.h>

#include <cctype>

namespace Ovradr {

namespace {

using OvraDRNode::Conn;

/// Authenticators show codes in groups.
std::string withoutBlanks(std::string code) {
    std::erase_if(code, [](unsigned char c) { return std::isspace(c) != 0; });
    return code;
}

Expected<std::string> askOneTimeCode() {
    if (!isInteractive()) {
        return failure(ExitCode::kUsage,
                       "There is no terminal on which the one-time code could be asked for.",
                       "Give it with --otp.");
    }
    return askSecret("One-time code").map([](const Secret &given) {
        return withoutBlanks(given.get());
    });
}

} // namespace

CLI::Option *addOneTimeCodeOption(CLI::App &command, std::string &code) {
    return command.add_option("--otp", code, "One-time code of the account")
        ->transform(withoutBlanks);
}

CLI::Option *addRemoteLoginOptions(CLI::App &command, RemoteLogin &login) {
    CLI::Option *account =
        command.add_option("--account", login.account, "Account on the other appliance");
    addPasswordOptions(command, login.password);
    CLI::Option *code = addOneTimeCodeOption(command, login.oneTimeCode);
    command.add_flag("--otp-prompt", login.askOneTimeCode, "Ask for the one-time code")
        ->excludes(code);
    return account;
}

CLI::Option *addFingerprintOption(CLI::App &command, std::string &fingerprint) {
    CLI::Option *option =
        command.add_option("--fingerprint", fingerprint, "The key that the other end must have")
            ->check(checkFingerprint);
    trims(*option);
    return option;
}

Expected<void> trustedEndpoint(const Conn &conn, const std::string &fingerprint) {
    return directEndpoint(conn).and_then(
        [&fingerprint](const Conn &direct) { return trustPeer(direct, fingerprint); });
}

Expected<void> logIn(const RemoteLogin &login, const std::string &host,
                     const LoginAttempt &attempt) {
    const Expected<Secret> password =
        obtainPassword(login.password, "Password of " + login.account + " on " + host, false);
    if (!password) {
        return Refusal(password.error());
    }
    std::string code = login.oneTimeCode;
    bool mayAsk = code.empty() && isInteractive();
    if (login.askOneTimeCode) {
        const Expected<std::string> asked = askOneTimeCode();
        if (!asked) {
            return Refusal(asked.error());
        }
        code = *asked;
        mayAsk = false;
    }
    if (attempt(password->get(), code) == OvraDRCore::ERR::kLoginOtpRequired && mayAsk) {
        const Expected<std::string> asked = askOneTimeCode();
        if (!asked) {
            return Refusal(asked.error());
        }
        attempt(password->get(), *asked);
    }
    return {};
}

} // namespace Ovradr
