// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/dr_node.h"
#include "ovradrnode/export.h"
#include "ovradrnode/sender.h"

#include <ovradrcore/err_recorder.h>

#include <functional>
#include <string>
#include <utility>

namespace OvraDRNode {

/// Changes a node credential: a new login, possibly over another endpoint, to the same node. The
/// row is rewritten first; then a session that nothing uses any more is released. Construct with
/// the credential id, setCred(), process(). Takes no lock, see CredCreate: the session that is
/// released is that of the row as setCredId() read it.
class OVRADRNODE_EXPORT DRNodeCredSet : public OvraDRCore::ErrRecorder {
public:
    DRNodeCredSet() = default;
    /// Runs setCredId() and keeps its error.
    explicit DRNodeCredSet(const std::string &credId);
    DRNodeCredSet(const DRNodeCredSet &) = delete;
    DRNodeCredSet &operator=(const DRNodeCredSet &) = delete;
    ~DRNodeCredSet() override;

    /// Loads the credential to change (401, 404, 516).
    [[nodiscard]] bool setCredId(const std::string &credId);
    /// The new endpoint and login (500, 401, or the error of the login).
    [[nodiscard]] bool setCred(const Conn &conn, const std::string &account,
                               const std::string &password, const std::string &otp);
    /// What the row gets as its endpoint instead of the direct one of the log-in: the relay
    /// endpoint that this stands for today. An invalid one changes nothing.
    void setStoredConn(const Conn &conn) { storedConn = conn; }
    bool IsSessionChanged() const;
    /// The session that the remote node granted for this change, a secret; "" before
    /// requestRemoteSession(). It may live although the change failed.
    const std::string &getGrantedSession() const { return grantedSession; }
    /// As CredCreate::setGrantObserver().
    void setGrantObserver(std::function<void(const std::string &session)> observer) {
        grantObserver = std::move(observer);
    }
    /// As CredCreate::getSessionError().
    const OvraDRCore::ErrRecorder &getSessionError() const { return sessionError; }
    /// Whether the new login reaches the node that the credential belongs to (518 if another).
    [[nodiscard]] bool check();
    [[nodiscard]] bool checkRemoteNodeInfo();
    [[nodiscard]] bool requestRemoteSession();
    [[nodiscard]] bool setCredRecord();
    /// The whole update.
    [[nodiscard]] bool process();

private:
    DRNode record;
    CredAccountSender sender;
    std::string newSession;
    std::string grantedSession;
    std::function<void(const std::string &)> grantObserver;
    OvraDRCore::ErrRecorder sessionError;
    Conn storedConn;
};

} // namespace OvraDRNode
