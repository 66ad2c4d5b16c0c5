// SPDX-License-Identifier: Apache-2.0
#include "failure.h"

#include <array>

namespace Ovradr {

namespace {

/// The names of what this program finds itself, in the order of the exit codes.
constexpr std::array kExitNames = {
    "ok",          "failed",    "usage",         "not_reachable", "login_refused", "one_time_code",
    "certificate", "not_found", "not_permitted", "not_set_up",    "name_unknown",  "no_appliance",
    "wrong_node",  "clock",
};

} // namespace

Failure failure(ExitCode exit, const std::string &message, const std::string &hint) {
    const int number = static_cast<int>(exit);
    return {exit, number, kExitNames.at(static_cast<std::size_t>(number)), message, hint};
}

} // namespace Ovradr
