// SPDX-License-Identifier: Apache-2.0
#include "handlers/credential_flows.h"

#include <ovradrnode/dr_node.h>

namespace Ovradrd {

std::string readCredId(Params &in) {
    std::string credId = in.text("cred_id", Params::kMaxId);
    if (OvraDRNode::DRNode::isLocalNodeId(credId)) {
        in.refuse("cred_id", "this is the node itself: name a credential to another node");
        return {};
    }
    return credId;
}

RemoteLogin::RemoteLogin(Params &in)
    : account(in.text("account", Params::kMaxAccount))
    , password(in.secret("password", Params::kMaxPassword))
    , otpCode(in.optionalSecret("otpcode", Params::kMaxCode)) {}

Proof::Proof(Params &in, bool withCredId) {
    std::vector<std::string> words = {"account", "session"};
    if (withCredId) {
        words.emplace_back("cred_id");
    }
    const std::string auth = in.word("auth", words);
    if (auth == "cred_id") {
        kind = Kind::kCredId;
        credId = readCredId(in);
        return;
    }
    conn = in.conn("conn");
    if (auth == "session") {
        kind = Kind::kSession;
        session = in.text("session", Params::kMaxSession);
        return;
    }
    login.emplace(in);
}

bool Proof::giveTo(OvraDRNode::CredCreate &flow) const {
    switch (kind) {
    case Kind::kAccount:
        return flow.setCred(conn, login->account, login->password.get(), login->otpCode);
    case Kind::kSession:
        return flow.setCred(conn, session);
    case Kind::kCredId:
        break;
    }
    return flow.setCred(credId);
}

} // namespace Ovradrd
