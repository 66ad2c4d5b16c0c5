// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "core/unique_fd.h"

#include <string>

namespace Ovradrd {

/// A socket that listens, and the port that it got.
struct Listener {
    enum class Problem { kNone, kPortInUse, kOther };

    OvraPlatform::UniqueFd socket;
    int port = 0;
    Problem problem = Problem::kNone;
    std::string why; ///< one sentence when there is a problem

    /// \param address  numeric; "" stands for every address of the machine, IPv4 and IPv6. One that
    ///                 the machine does not have yet is served as soon as it has it.
    /// \param port     0: any that is free
    static Listener listen(const std::string &address, int port);
};

} // namespace Ovradrd
