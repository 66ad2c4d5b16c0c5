// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovraplatform/account_store.h>

#include <string>

namespace Ovradrd {

/// The user of a session.
struct SessionOwner {
    enum class State {
        kFound,
        kUnknown,  ///< no such session, or it has expired, or its account is gone
        kNotKnown, ///< the stores cannot be read; the log says why
    };

    State state = State::kUnknown;
    OvraPlatform::Account account; ///< its current state, with kFound
};

/// Looks a session up, as every call does. Each thread keeps the two stores open, because opening
/// them costs ten times as much as a query; a file that was replaced or failed is reopened.
SessionOwner findSessionOwner(const std::string &sid);

} // namespace Ovradrd
