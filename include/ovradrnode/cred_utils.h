// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/export.h"

#include <string>

namespace OvraDRNode {
namespace CredUtils {

/// Whether the remote node still accepts the session.
OVRADRNODE_EXPORT bool TestSessionValid(const Conn &conn, const std::string &session);
/// Releases the session on the remote node unless a node credential still uses it. True also when
/// one does, and when the session was dead already.
OVRADRNODE_EXPORT bool NotifyRemoteNodeDeleteSessionIfNotUsed(const Conn &conn,
                                                              const std::string &session);

} // namespace CredUtils
} // namespace OvraDRNode
