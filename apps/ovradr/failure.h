// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrcore/err_recorder.h>

#include <json/value.h>
#include <tl/expected.hpp>

#include <string>

namespace OvraDRCore {
class ErrRecorder;
class Response;
} // namespace OvraDRCore

namespace Ovradr {

/// What the program exits with; docs/ovradr.md tells scripts.
enum class ExitCode : int {
    kOk = 0,
    kFailed = 1,       ///< the operation failed
    kUsage = 2,        ///< the command line is wrong
    kNotReachable = 3, ///< no answer from the other end
    kLoginRefused = 4,
    kOneTimeCode = 5, ///< a one-time code is required, or it is wrong
    kCertificate = 6, ///< the key of the other end is not, or not yet, trusted
    kNotFound = 7,
    kNotPermitted = 8,
    kNotSetUp = 9, ///< not set up, or the files of this appliance cannot be used
    // What only an examination tells apart.
    kNameUnknown = 10, ///< the name of the host is not known
    kNoAppliance = 11, ///< what answers is no appliance
    kWrongNode = 12,   ///< another node answers than the one that was paired with
    kClock = 13,       ///< the clocks differ too much
};

/// Why a command did not do what it was asked for.
struct Failure {
    ExitCode exit = ExitCode::kFailed;
    /// The library's or the web API's error code; the exit code for what this program found itself.
    int code = 0;
    std::string name;    ///< one word for scripts
    std::string message; ///< one sentence: what was wrong
    std::string hint;    ///< one sentence: what to do
    Json::Value data;    ///< what was found nevertheless, for scripts; mostly null
    std::string text;    ///< the same for people: whole lines, safe for a terminal
};

/// A value, or why there is none.
template <typename T>
using Expected = tl::expected<T, Failure>;
using Refusal = tl::unexpected<Failure>;

/// A failure that this program found itself.
Refusal failure(ExitCode exit, const std::string &message, const std::string &hint);

/// Why a store of this appliance cannot be used.
/// \param sentences  the first one says what is wrong, the others what to do
Refusal storeFailure(ExitCode exit, const std::string &sentences);

/// The failure that an error code of the library or of the web API stands for.
/// \param detail  what came with the code; null when nothing did
Refusal failureOf(int code, const Json::Value &detail = Json::Value());
Refusal failureOf(const OvraDRCore::ErrRecorder &error);

/// What a command found or did, in both forms in which it can be told.
struct Report {
    Json::Value data; ///< for scripts
    std::string text; ///< for people; whole lines, safe for a terminal
};

/// The result of a command.
using Outcome = Expected<Report>;

} // namespace Ovradr
