// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>
#include <ovrabase/unique_fd.h>

#include <string>

namespace OvraService {

/// A listening socket and its port.
struct Listener {
    OvraBase::UniqueFd socket;
    int port = 0;

    /// \param address  numeric; "" stands for every address of the machine, IPv4 and IPv6. One that
    ///                 the machine does not have yet is served as soon as it does.
    /// \param port     0: any free port
    /// \return EADDRINUSE if another program has the port
    [[nodiscard]] static OvraBase::Expected<Listener> listen(const std::string &address, int port);
};

} // namespace OvraService
