// SPDX-License-Identifier: Apache-2.0
#include "handlers/invite.h"

#include "handlers/auth.h"
#include "handlers/params.h"
#include "shared/invites.h"

#include <ovradrcore/log.h>
#include <ovradrnode/dr_node.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/session_store.h>

#include <optional>
#include <string>

namespace Ovradrd {

namespace {

namespace APIError = OvraPlatform::APIError;
using OvraApps::Invite;
using OvraApps::InviteRefusal;
using OvraApps::Invites;
using OvraPlatform::APICaller;
using OvraPlatform::apiError;

constexpr char kReference[] = "invite";
constexpr char kSecret[] = "secret";
constexpr char kNodeId[] = "node_id";

const char *refusalText(InviteRefusal refusal) {
    switch (refusal) {
    case InviteRefusal::kUnknown:
        return "there is no such invitation, or the code is wrong: compare the code";
    case InviteRefusal::kUsed:
        return "the invitation was used already: ask for a new one, and if nobody of yours used "
               "it, have its session ended";
    case InviteRefusal::kExpired:
        return "the invitation has expired: ask for a new one";
    case InviteRefusal::kRevoked:
        return "the invitation was revoked: ask for a new one";
    case InviteRefusal::kAccount:
        return "the account of the invitation is gone, disabled or may not pair: ask for an "
               "invitation with another one";
    default:
        return "the invitations cannot be read now: see the log of the appliance";
    }
}

Json::Value refused(InviteRefusal refusal) {
    return apiError(static_cast<int>(refusal), refusalText(refusal));
}

/// A short session of the invitation's account.
std::optional<std::string> openSession(const Invite &invite, const APICaller &caller) {
    OvraPlatform::SessionRequest request;
    request.user = invite.account;
    request.app = LoginApi::kApplication;
    request.remote = caller.address;
    request.timeout = InviteApi::kSessionTime;
    request.keepOthers = true;
    return OvraPlatform::SessionStore().create(request);
}

} // namespace

Json::Value InviteApi::redeem(const Json::Value &params, const APICaller &caller) {
    if (caller.local) {
        return apiError(APIError::kBadRequest, "an invitation is for other appliances");
    }
    Params in(params);
    const std::string reference = in.text(kReference, Invites::kReferenceLength);
    const OvraBase::Secret secret = in.secret(kSecret, Invites::kSecretLength);
    const std::string node = in.text(kNodeId, Params::kMaxId);
    if (in.ok() && !Invites::isReference(reference)) {
        in.refuse(kReference, "invite has to be 8 hexadecimal digits in lower case");
    }
    if (in.ok() && OvraDRNode::DRNode::isLocalNodeId(node)) {
        in.refuse(kNodeId, "node_id is this node itself: use the code on another one");
    }
    if (!in.ok()) {
        return in.error();
    }
    const auto attempt = throttle_.admit({"invite " + reference, caller.address, ""});
    if (!attempt) {
        return apiError(APIError::kTooBusy, "too many wrong codes came: try again in " +
                                                std::to_string(attempt.error().count()) +
                                                " seconds");
    }
    Invites invites;
    Invite invite;
    InviteRefusal refusal = invites.take(reference, secret.get(), node, caller.address, invite);
    if (refusal != InviteRefusal::kUnknown) {
        throttle_.withdraw(*attempt);
    }
    std::optional<std::string> sid;
    if (refusal == InviteRefusal::kNone) {
        const auto account = OvraPlatform::AccountStore().find(invite.account);
        sid = account && account->mayPair() ? openSession(invite, caller) : std::nullopt;
        if (!sid) {
            refusal = account && account->mayPair() ? InviteRefusal::kStoreFailed
                                                    : InviteRefusal::kAccount;
            (void)invites.giveBack(reference); // the log says why not
        }
    }
    if (!sid) {
        OVRA_NOTICE("The invitation [%s] was refused to [%s] with [%d]", reference.c_str(),
                    caller.address.c_str(), static_cast<int>(refusal));
        return refused(refusal);
    }
    OVRA_NOTICE("The invitation [%s] of the account [%s] was taken up by node [%s] from [%s]",
                reference.c_str(), invite.account.c_str(), node.c_str(), caller.address.c_str());
    Json::Value data(Json::objectValue);
    data["sid"] = *sid;
    data["account"] = invite.account;
    return OvraPlatform::apiSuccess(data);
}

void InviteApi::addTo(OvraPlatform::APIRegistry &registry) {
    registry.add(OvraApps::kInviteApi, OvraApps::kInviteVersion, OvraApps::kRedeem,
                 OvraPlatform::APIRight::kNone, OvraPlatform::APIQueue::kQuick,
                 [this](const Json::Value &params, const APICaller &caller) {
                     return redeem(params, caller);
                 });
}

} // namespace Ovradrd
