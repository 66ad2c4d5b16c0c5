// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovradrnode/conn.h>

#include <string>

namespace Ovradr {

inline constexpr int kDefaultHttpPort = 5000;
inline constexpr int kDefaultHttpsPort = 5001;

/// Reads an endpoint as people write it: https://HOST[:PORT], http://HOST[:PORT] or flk:ALIAS,
/// blanks around it aside. HOST is a name (one in UTF-8 becomes its form in ASCII), an IPv4
/// address, or an IPv6 address in brackets, which the endpoint drops, a link-local one with its
/// interface; each endpoint has one spelling. Anything more (a user, a path, a query) is refused:
/// it would be lost silently.
[[nodiscard]] Expected<OvraDRNode::Conn> parseTarget(const std::string &text);

/// The endpoint as parseTarget() reads it, always with its port; for an alias without one.
std::string targetText(const OvraDRNode::Conn &conn);

} // namespace Ovradr
