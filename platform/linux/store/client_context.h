// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <optional>
#include <string>

namespace OvraPlatform {

/// The numeric address of the web client: the innermost ClientScope of this thread, else the
/// environment variable REMOTE_ADDR (RFC 3875, 4.1.8); std::nullopt if there is neither or if it is
/// not a numeric address.
[[nodiscard]] std::optional<std::string> clientAddress();

} // namespace OvraPlatform
