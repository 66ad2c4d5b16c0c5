// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <string>

namespace OvraService {

/// What a daemon exits with.
enum class ExitCode : int {
    kOk = 0,
    kFailed = 1,
    kUsage = 2,
    kPortInUse = 3,
    kNotSetUp = 9, ///< the same number as ovradr has for it
};

/// Why a daemon does not start.
struct StartError {
    ExitCode exit = ExitCode::kFailed;
    std::string text; ///< one sentence for people

    StartError(ExitCode code, std::string why)
        : exit(code)
        , text(std::move(why)) {}
    StartError(OvraBase::Error why) // NOLINT(google-explicit-constructor)
        : text(std::move(why.text)) {}
};

} // namespace OvraService
