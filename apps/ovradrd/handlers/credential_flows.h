// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "handlers/params.h"

#include <ovrabase/secret.h>
#include <ovradrnode/conn.h>
#include <ovradrnode/node_create.h>

#include <optional>
#include <string>

namespace Ovradrd {

/// The id of a credential that reaches another node; the local node's own record is refused.
std::string readCredId(Params &in);

/// Account, password and one-time code of a log-in at another node.
struct RemoteLogin {
    std::string account;
    OvraBase::Secret password;
    std::string otpCode;

    /// Parameters "account", "password" and, where needed, "otpcode".
    explicit RemoteLogin(Params &in);
};

/// How a new credential is proved to the other node: the parameter "auth" says which other
/// parameters are the proof.
struct Proof {
    enum class Kind { kAccount, kSession, kCredId };

    Kind kind = Kind::kAccount;
    OvraDRNode::Conn conn;            ///< not with kCredId
    std::optional<RemoteLogin> login; ///< with kAccount
    std::string session;              ///< with kSession
    std::string credId;               ///< with kCredId

    /// \param withCredId  whether "cred_id" may be the proof
    Proof(Params &in, bool withCredId);

    /// Gives the proof to the flow; if false, the flow says why.
    [[nodiscard]] bool giveTo(OvraDRNode::CredCreate &flow) const;
};

} // namespace Ovradrd
