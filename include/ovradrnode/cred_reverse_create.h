// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/dr_node.h"
#include "ovradrnode/export.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/request.h>
#include <ovradrcore/response.h>

#include <json/value.h>

#include <string>
#include <vector>

namespace OvraDRNode {

/// Has a remote node create a credential for this one, over a credential that this node holds: the
/// remote picks one of the offered endpoints, gets a short-lived local session, and creates its
/// credential from both. setCredId(), setLocalAccount(), addLocalConns(), then check() or
/// process(). Nothing is written here. The temporary session is deleted again before process() or
/// check() returns, and ends by itself after 300 seconds. If the remote node's answer is lost, it
/// may have created its credential all the same: NodeSession has the session that it got for it.
/// Takes no lock, see CredCreate.
class OVRADRNODE_EXPORT CredReverseCreate : public OvraDRCore::ErrRecorder {
public:
    ~CredReverseCreate() override;
    /// Asks the remote node to create its credential.
    [[nodiscard]] virtual bool relayCreate(const Conn &conn, const std::string &session);

    // Setters record no code.
    [[nodiscard]] bool setCredId(const std::string &credId);
    [[nodiscard]] bool setLocalAccount(const std::string &account);
    void setCredInfo(const Json::Value &info) { credInfo = info; }
    [[nodiscard]] bool addLocalConn(const Conn &conn);
    /// In order, up to the first refused one.
    [[nodiscard]] bool addLocalConns(const std::vector<Conn> &conns);
    [[nodiscard]] bool checkParameter() const;
    [[nodiscard]] OvraDRCore::Response sendReq(const OvraDRCore::Request &request) const;
    /// Finds out which of the offered endpoints the remote node can reach (522 if its answer is not
    /// a valid endpoint).
    [[nodiscard]] bool testAvailableConn(Conn &conn) const;
    /// The whole flow, except that the remote only checks.
    [[nodiscard]] bool check();
    /// The whole flow. The result is whether an error was recorded.
    [[nodiscard]] bool process();

    /// What the remote node reported about the credential that it created.
    const Json::Value &getCredInfo() const { return credInfo; }

private:
    template <typename Step>
    bool withTempSession(const char *function, Step step);

    std::string localAccount;
    DRNode record;
    std::vector<Conn> localConns;
    Json::Value credInfo;
};

/// The same for a temporary credential on the remote side.
class OVRADRNODE_EXPORT TempCredReverseCreate : public CredReverseCreate {
public:
    ~TempCredReverseCreate() override;
    [[nodiscard]] bool relayCreate(const Conn &conn, const std::string &session) override;
};

} // namespace OvraDRNode
