// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/export.h"

#include <ovradrcore/err_recorder.h>

#include <string>

namespace OvraDRNode {

/// Login sessions on this appliance that are granted to remote nodes. They live in the appliance's
/// own session store, marked with kApplication. Only DeleteBySessionId() reaches a session of
/// another application, and only the one that it names. Each operation stores its outcome as the
/// error code. It takes no lock: a caller that may grant to one node from several threads or
/// processes at once has to, or the node gets more than one session.
class OVRADRNODE_EXPORT NodeSession : public OvraDRCore::ErrRecorder {
public:
    /// The application that marks them in the store.
    static constexpr char kApplication[] = "Tidewater";

    NodeSession() = default;
    ~NodeSession() override;

    /// The session of this node and user: the existing one, or a new one that lasts until it is
    /// removed. "" on failure (401, also for an id that is not UTF-8 or has more than about 1,000
    /// bytes; 527 no such user; 511).
    [[nodiscard]] std::string CreateNodeSession(const std::string &nodeId,
                                                const std::string &userName);
    /// A session without a node that ends after `timeout` seconds. "" on failure (401, 527); if
    /// only the store failed, the code is 0.
    [[nodiscard]] std::string CreateTempSession(const std::string &userName, unsigned int timeout);
    /// Removes a session of any application. 401 or 512 on failure; deleting one that does not
    /// exist succeeds.
    void DeleteBySessionId(const std::string &sessionId);
    /// Removes all sessions granted for this user, temporary ones included.
    void DeleteByUser(const std::string &userName);
    /// The user of a session of any application. "" on failure (401, 528).
    [[nodiscard]] std::string GetUserBySession(const std::string &sessionId);
    /// Removes all granted sessions, of every user.
    void DeleteAllNodeSession();

    /// The node of a granted session; "" if it has none.
    /// \param extra  the session's extra data in the store
    static std::string NodeIdOf(const std::string &extra);
    /// The extra data of a session that is granted to the node. It is searched for as text, so it
    /// never changes.
    static std::string ExtraOf(const std::string &nodeId);
};

} // namespace OvraDRNode
