// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/export.h"

#include <string>

namespace OvraDRNode {
namespace CredUtils {

/// Whether the remote node still accepts the session.
[[nodiscard]] OVRADRNODE_EXPORT bool TestSessionValid(const Conn &conn, const std::string &session);
/// Releases the session on the remote node unless a node credential still uses it. True also when
/// one does, and when the session was dead already.
[[nodiscard]] OVRADRNODE_EXPORT bool
NotifyRemoteNodeDeleteSessionIfNotUsed(const Conn &conn, const std::string &session);

/// How many node credentials hold the session; only these keep a session alive, temporary ones do
/// not. Reads the node database.
/// \param exceptCredId  a credential that does not count, or ""
/// \return -1 when it cannot be told: the session is empty, or the database cannot be read. Logged
///         at ERR.
[[nodiscard]] OVRADRNODE_EXPORT int GetSessionUsedCount(const std::string &session,
                                                        const std::string &exceptCredId = "");

} // namespace CredUtils
} // namespace OvraDRNode
