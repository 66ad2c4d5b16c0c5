// SPDX-License-Identifier: Apache-2.0
#include "pairing.h"

#include "cred_report.h"
#include "open_call.h"
#include "target.h"

#include <ovradrcore/json.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/totp.h>

namespace Ovradr {

namespace {

using OvraApps::FlowState;
using OvraDRNode::Conn;
using OvraDRNode::CredCreate;
using OvraDRNode::CredReverseCreate;
using OvraDRNode::DRNode;
using OvraPlatform::AccountStore;
using OvraPlatform::Role;
namespace ERR = OvraDRCore::ERR;

/// Two processes may make it at the same time.
Expected<void> makePairingAccount() {
    AccountStore store;
    if (!store.isOpen()) {
        return storeFailure(ExitCode::kNotSetUp, store.error());
    }
    if (store.exists(kPairingAccount)) {
        return {};
    }
    std::string random = OvraPlatform::newTotpSecret();
    const Secret password = Secret::take(random);
    return store.add(kPairingAccount, password.get(), Role::kPairing) ||
                   store.exists(kPairingAccount)
               ? Expected<void>()
               : storeFailure(ExitCode::kFailed, store.error());
}

/// This appliance's daemon must run, and the account must be allowed to grant sessions.
Expected<void> checkAccount(const std::string &account) {
    const OvraDRCore::Response answer =
        OvraDRNode::BaseSender::run(OvraDRNode::WebAPI::OvraCoreUserGetAPI(account));
    if (answer.getErrCode() == OvraPlatform::APIError::kBadParameter) {
        return failure(ExitCode::kNotFound, "This appliance has no account \"" + account + "\".",
                       "`ovradr user list` shows those that it has.");
    }
    if (!answer.isSuccess()) {
        Refusal found = failureOf(answer.getErrCode(), answer.getErrMsg());
        found.value().message.insert(0, "The account " + account + " of this appliance: ");
        return found;
    }
    const Json::Value &data = answer.getData();
    const std::string role = OvraDRCore::memberString(data, "role");
    const bool mayPair = role == OvraPlatform::roleWord(Role::kPairing) ||
                         role == OvraPlatform::roleWord(Role::kAdministrator);
    const bool disabled = data["disabled"].isBool() && data["disabled"].asBool();
    if (mayPair && !disabled) {
        return {};
    }
    return failure(ExitCode::kNotPermitted,
                   "The account " + account + " of this appliance " +
                       (disabled ? "is disabled." : "may not pair."),
                   "The other appliance would get no session with it; use one with the role "
                   "pairing or administrator.");
}

} // namespace

Refusal creationFailure(const CredCreate &flow, const Conn &conn) {
    // The one code with which storing the row fails; no other step of a creation has it.
    if (flow.GetErrCode() == ERR::kCredNotFound) {
        return failure(ExitCode::kNotSetUp,
                       "The other appliance granted the credential, but it could not be stored.",
                       "The system log says why; correct that and make the credential again.");
    }
    return withClock(credFlowFailure(flow, flow.getSessionError(), conn), conn);
}

Expected<void> proveByAccount(CredCreate &flow, const RemoteLogin &login, const Conn &conn) {
    bool proved = false;
    const auto attempt = [&](const std::string &password, const std::string &code) {
        proved = flow.setCred(conn, login.account, password, code);
        return proved ? 0 : flow.GetErrCode();
    };
    if (const auto tried = logIn(login, conn.addr, attempt); !tried) {
        return Refusal(tried.error());
    }
    return proved ? Expected<void>() : creationFailure(flow, conn);
}

Expected<void> meetNode(CredCreate &flow, const Conn &conn) {
    if (!flow.getRemoteNodeInfo()) {
        return creationFailure(flow, conn);
    }
    if (flow.isLocalNode()) {
        return failure(ExitCode::kUsage, targetText(conn) + " is this appliance itself.",
                       "Give the URL of another one.");
    }
    return {};
}

Expected<void> createCred(CredCreate &flow, const Conn &conn) {
    switch (OvraApps::createCredential(flow)) {
    case FlowState::kDone:
        return {};
    case FlowState::kBusy:
        return busyFailure();
    default:
        return creationFailure(flow, conn);
    }
}

Expected<std::string> localAccount(const std::string &account) {
    const Expected<void> made = account.empty() ? makePairingAccount() : Expected<void>();
    const std::string name = account.empty() ? kPairingAccount : account;
    return made.and_then([&name] { return checkAccount(name); }).map([&name] { return name; });
}

Expected<std::vector<Conn>> offeredConns(const std::vector<std::string> &endpoints) {
    std::vector<Conn> conns;
    for (const std::string &text : endpoints) {
        const Expected<Conn> conn = parseTarget(text);
        if (!conn) {
            return Refusal(conn.error());
        }
        conns.push_back(*conn);
    }
    if (conns.empty()) {
        conns = DRNode::getLocalConn();
    }
    if (conns.empty()) {
        return failure(ExitCode::kFailed, "This appliance has no address that others reach.",
                       "Bring an interface up, or name an endpoint with --endpoint.");
    }
    return conns;
}

Refusal reverseFailure(const CredReverseCreate &flow) {
    // With words it is what the other appliance said about the endpoints of this one.
    const bool unreachable =
        flow.GetErrCode() == ERR::kNotConnectable && !flow.GetErrMsg().isNull();
    Refusal found = unreachable ? failureOf(ERR::kRemoteConnInvalid)
                                : failureOf(flow.GetErrCode() == ERR::kNone ? ERR::kCredIncomplete
                                                                            : flow.GetErrCode(),
                                            flow.GetErrMsg());
    found.value().message.insert(0, "No credential back to this appliance: ");
    return found;
}

} // namespace Ovradr
