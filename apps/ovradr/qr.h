// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>

namespace Ovradr {

/// The text as a QR code for a terminal, whole lines; "" if standard error is no terminal, or none
/// that is wide enough. Light on dark whatever the colours of the terminal are.
std::string qrForTerminal(const std::string &text);

} // namespace Ovradr
