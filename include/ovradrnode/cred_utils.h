// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/export.h"

#include <string>

namespace OvraDRNode {
namespace CredUtils {

/// Whether the remote node still accepts the session.
[[nodiscard]] OVRADRNODE_EXPORT bool TestSessionValid(const Conn &conn, const std::string &session);
/// Releases the session on the remote node unless a node credential still uses it. True also if one
/// does, and if the session had already ended.
[[nodiscard]] OVRADRNODE_EXPORT bool
NotifyRemoteNodeDeleteSessionIfNotUsed(const Conn &conn, const std::string &session);

/// How many node credentials use the session; temporary credentials do not keep it alive. Reads the
/// node database.
/// \param exceptCredId  a credential not to count, or ""
/// \return -1 if unknown: the session is empty, or the database cannot be read. Logged at ERR.
[[nodiscard]] OVRADRNODE_EXPORT int GetSessionUsedCount(const std::string &session,
                                                        const std::string &exceptCredId = "");

} // namespace CredUtils
} // namespace OvraDRNode
