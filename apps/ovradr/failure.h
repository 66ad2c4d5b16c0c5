// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrcore/err_recorder.h>
#include <ovradrnode/conn.h>
#include <ovraplatform/cred_errors.h>

#include <json/value.h>
#include <tl/expected.hpp>

#include <string>

namespace OvraDRCore {
class ErrRecorder;
class Response;
} // namespace OvraDRCore

namespace Ovradr {

/// The program's exit codes, as documented for scripts in docs/ovradr.md.
enum class ExitCode : int {
    kOk = 0,
    kFailed = 1,       ///< the operation failed
    kUsage = 2,        ///< the command line is wrong
    kNotReachable = 3, ///< no answer from the other end
    kLoginRefused = 4,
    kOneTimeCode = 5, ///< a one-time code is required, or it is wrong
    kCertificate = 6, ///< the key of the other end is not trusted, or not yet
    kNotFound = 7,
    kNotPermitted = 8,
    kNotSetUp = 9, ///< not set up, or the files of this appliance cannot be used
    // Distinguished only by a diagnosis.
    kNameUnknown = 10, ///< unknown host name
    kNoAppliance = 11, ///< what answers is not an appliance
    kWrongNode = 12,   ///< a different node than the paired one answers
    kClock = 13,       ///< the clocks differ too much
};

/// Why a command failed.
struct Failure {
    ExitCode exit = ExitCode::kFailed;
    /// The library's or the web API's error code; the exit code for failures found by this program
    /// itself.
    int code = 0;
    std::string name;    ///< one word for scripts
    std::string message; ///< one sentence: what was wrong
    std::string hint;    ///< one sentence: what to do
    Json::Value data;    ///< what was found anyway, for scripts; mostly null
    std::string text;    ///< the same for people: whole lines, safe for a terminal
};

/// A value, or why there is none.
template <typename T>
using Expected = tl::expected<T, Failure>;
using Refusal = tl::unexpected<Failure>;

/// A failure found by this program itself.
Refusal failure(ExitCode exit, const std::string &message, const std::string &hint);

/// The exit code for an error of the credential request library.
ExitCode exitOf(OvraPlatform::CredError error);

/// Why a store of this appliance cannot be used.
/// \param sentences  the first one says what is wrong, the others what to do
Refusal storeFailure(ExitCode exit, const std::string &sentences);

/// The failure for an error code of the library or of the web API.
/// \param detail  what came with the code; null if nothing did
Refusal failureOf(int code, const Json::Value &detail = Json::Value());
/// An endpoint that did not answer is looked at again to say why, which takes up to 9 seconds.
Refusal failureOf(const OvraDRCore::ErrRecorder &error);

/// Has the failure, and the command that it advises, name the endpoint.
void nameEndpoint(Failure &failure, const OvraDRNode::Conn &conn);

/// Has the failure say why the endpoint does not answer (whyNotReachable()). Not of an invalid one.
void addReason(Failure &failure, const OvraDRNode::Conn &conn);

/// What a command found or did, in both output forms.
struct Report {
    Json::Value data; ///< for scripts
    std::string text; ///< for people; whole lines, safe for a terminal
};

/// The result of a command.
using Outcome = Expected<Report>;

} // namespace Ovradr
