// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/dr_node.h"
#include "ovradrnode/export.h"
#include "ovradrnode/sender.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/request.h>
#include <ovradrcore/response.h>
#include <ovradrcore/sqlite_command.h>

#include <functional>
#include <string>
#include <utility>

namespace OvraDRNode {

/// Creates a credential: authenticates to the remote node, requests its identity and a session, and
/// stores the record. Construct, call one setCred() overload, then process() (or check()); on false
/// read GetErr(). Nothing is written locally before the last step; if that step fails, the session
/// that the remote granted is not released.
///
/// The flows for credentials take no lock: none knows of another one, in this process or another,
/// that concerns the same node. The remote node hands out the previous session of node and account
/// as long as it has it, so a caller with several flows at once has to keep a creation apart from
/// whatever may release a session, and every change and deletion apart from all others, each from
/// its first look at the row. Otherwise a stored session may be released, or one that nothing uses
/// stay on the remote node.
class OVRADRNODE_EXPORT CredCreate : public OvraDRCore::ErrRecorder {
public:
    ~CredCreate() override;
    /// The request for the remote session of this kind of credential.
    virtual OvraDRCore::Request getSessionRequestAPI() const = 0;
    /// The table that stores the record.
    virtual OvraDRCore::SqliteTableHandler getCredTableHandler() const = 0;

    CredCreate() = default;
    CredCreate(const CredCreate &) = delete;
    CredCreate &operator=(const CredCreate &) = delete;

    /// Checks and probes the endpoint (401, 500).
    [[nodiscard]] bool setConn(const Conn &conn);
    /// Takes ownership of a sender that is ready to use (403 for null).
    [[nodiscard]] bool setSender(BaseSender *newSender);
    /// Initialises the sender (a login, for an account) and takes ownership of it; it is deleted on
    /// failure.
    [[nodiscard]] bool setCredSender(BaseCredSender *newSender);
    void clearSender();
    [[nodiscard]] bool setCredAccount(const std::string &newAccount);

    /// Authenticates by a login. `otp` may be empty. A failed setCred() of any form leaves no
    /// sender, so that nothing goes on with that of an earlier one; with bad parameters (401) it
    /// changes nothing.
    [[nodiscard]] bool setCred(const Conn &conn, const std::string &newAccount,
                               const std::string &password, const std::string &otp);
    /// Authenticates by a session that the remote node granted before.
    [[nodiscard]] bool setCred(const Conn &conn, const std::string &session);
    /// Authenticates by a credential that this node holds.
    [[nodiscard]] bool setCred(const std::string &credId);

    [[nodiscard]] bool checkParameter() const;
    /// Whether the account works on the remote node; creates nothing.
    [[nodiscard]] bool check() const;
    [[nodiscard]] bool checkCredAccount() const;
    /// Sends every remote request of the flow.
    [[nodiscard]] OvraDRCore::Response sendReq(const OvraDRCore::Request &request) const;
    [[nodiscard]] bool getRemoteNodeInfo();
    [[nodiscard]] bool requestRemoteSession();
    [[nodiscard]] bool queryCredAccountBySession(const std::string &session,
                                                 std::string &foundAccount) const;
    [[nodiscard]] bool insertCredNodeRecord();
    /// The whole creation.
    [[nodiscard]] bool process();

    /// Whether the node that getRemoteNodeInfo() reached is this one. No step refuses a credential
    /// for this node itself; callers that do not want one check here before a session is requested.
    [[nodiscard]] bool isLocalNode() const;
    /// As process(), for a caller that has already run getRemoteNodeInfo() to check the node: its
    /// identity is not requested again.
    /// \return false with the codes of process(); 519 if no node was reached.
    [[nodiscard]] bool processKnownNode();

    /// The record as built so far.
    const DRNode &getNode() const { return node; }
    /// The session that the remote node granted, a secret; "" before requestRemoteSession(). It may
    /// live although the creation failed.
    const std::string &getGrantedSession() const { return grantedSession; }
    /// Tells `observer` that session as soon as it is known, before it is tested or stored, so that
    /// it can be noted where it outlives this process.
    void setGrantObserver(std::function<void(const std::string &session)> observer) {
        grantObserver = std::move(observer);
    }
    /// Why the remote node granted no session (509): its answer, or what the sender met; code 0 if
    /// it granted one, or was not asked.
    const OvraDRCore::ErrRecorder &getSessionError() const { return sessionError; }

private:
    [[nodiscard]] bool completes(bool done);
    [[nodiscard]] bool createFor(const char *function);

    DRNode node;
    std::string account;
    std::string grantedSession;
    std::function<void(const std::string &)> grantObserver;
    OvraDRCore::ErrRecorder sessionError;
    BaseSender *sender = nullptr;
};

/// A lasting credential: a session for this node's id, a row in "node_cred".
class OVRADRNODE_EXPORT DRNodeCredCreate : public CredCreate {
public:
    ~DRNodeCredCreate() override;
    OvraDRCore::Request getSessionRequestAPI() const override;
    OvraDRCore::SqliteTableHandler getCredTableHandler() const override;
};

/// A credential for short-lived use: a temporary session, a row in "temp_cred".
class OVRADRNODE_EXPORT TempCredCreate : public CredCreate {
public:
    ~TempCredCreate() override;
    OvraDRCore::Request getSessionRequestAPI() const override;
    OvraDRCore::SqliteTableHandler getCredTableHandler() const override;
};

} // namespace OvraDRNode
