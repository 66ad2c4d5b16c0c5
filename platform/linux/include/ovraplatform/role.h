// SPDX-License-Identifier: Apache-2.0
#pragma once

namespace OvraPlatform {

/// What an account may do; each one may also do what those before it may. The numbers are in the
/// account store.
enum class Role : int {
    kUser = 0,          ///< log in, and ask about itself
    kPairing = 1,       ///< pair, and send requests of the node web API: nothing of accounts, and
                        ///< no session of another one
    kAdministrator = 2, ///< everything
};

/// "user", "pairing" or "administrator".
inline const char *roleWord(Role role) {
    switch (role) {
    case Role::kAdministrator:
        return "administrator";
    case Role::kPairing:
        return "pairing";
    case Role::kUser:
        break;
    }
    return "user";
}

} // namespace OvraPlatform
