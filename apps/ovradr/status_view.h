// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <json/value.h>

#include <string>

namespace Ovradr {

/// An overview (docs/wire.md) on one screen: this node, the problems first, then a row a peer.
/// Whole lines, safe for a terminal; what is not known is left out.
std::string statusText(const Json::Value &overview);

/// What fits a terminal: no line wraps, and none is below the last row.
std::string screenful(const std::string &text, std::size_t columns, std::size_t rows);

} // namespace Ovradr
