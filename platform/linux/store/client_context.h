// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <optional>
#include <string>

namespace OvraPlatform {

/// The numeric address of the web client: the innermost ClientScope of this thread, else the
/// environment variable REMOTE_ADDR (RFC 3875, 4.1.8); nothing when there is neither or when it is
/// not a numeric address.
[[nodiscard]] std::optional<std::string> clientAddress();

} // namespace OvraPlatform
