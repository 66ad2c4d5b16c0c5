// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/export.h"

#include <ovradrcore/err_recorder.h>

#include <string>

namespace OvraDRNode {

/// Login sessions on this appliance that are granted to remote nodes. They live in the appliance's
/// own session store, marked as ours; sessions of other applications are never touched. Each
/// operation leaves its outcome as the error code.
class OVRADRNODE_EXPORT NodeSession : public OvraDRCore::ErrRecorder {
public:
    /// The application that they are marked with in the store.
    static constexpr char kApplication[] = "Tidewater";

    NodeSession() = default;
    ~NodeSession() override;

    /// The session of this node and user: the one that there is, or a new one that lasts until it
    /// is removed. "" on failure (401, 527 no such user, 511).
    [[nodiscard]] std::string CreateNodeSession(const std::string &nodeId,
                                                const std::string &userName);
    /// A session that is tied to no node and ends after `timeout` seconds. "" on failure (401,
    /// 527); when only the store failed, the code is 0.
    [[nodiscard]] std::string CreateTempSession(const std::string &userName, unsigned int timeout);
    /// 401 or 512 on failure; a session that is not there is deleted too.
    void DeleteBySessionId(const std::string &sessionId);
    /// Removes all that was granted for this user, temporary ones included.
    void DeleteByUser(const std::string &userName);
    /// "" on failure (401, 528).
    [[nodiscard]] std::string GetUserBySession(const std::string &sessionId);
    /// Removes all that was granted, of every user.
    void DeleteAllNodeSession();

    /// The node that a session of ours is tied to; "" when it is tied to none.
    /// \param extra  what the store keeps with the session as its extra data
    static std::string NodeIdOf(const std::string &extra);
};

} // namespace OvraDRNode
