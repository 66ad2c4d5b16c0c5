// SPDX-License-Identifier: Apache-2.0
#include "handlers/credential_flows.h"
#include "handlers/flow_error.h"
#include "handlers/handlers.h"
#include "handlers/params.h"
#include "handlers/relay.h"
#include "handlers/words.h"
#include "shared/session_release.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovradrnode/cred_reverse_create.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_create.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/node_set.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/api_errors.h>

#include <string>
#include <vector>

namespace Ovradrd {

namespace {

namespace ERR = OvraDRCore::ERR;
using OvraApps::FlowState;
using OvraDRNode::Conn;
using OvraDRNode::CredReverseCreate;
using OvraDRNode::DRNode;
using OvraDRNode::DRNodeDB;
using OvraPlatform::APICaller;
using OvraPlatform::apiError;
using OvraPlatform::apiSuccess;
using OvraPlatform::Role;

constexpr char kDirection[] = "cred_direction";
constexpr char kUnidirection[] = "unidirection";
constexpr char kBidirection[] = "bidirection";

Json::Value noSuchCredential() {
    return apiError(ERR::kCredNotFound, "this node has no such credential: list those that it has");
}

/// The reply of a flow behind another one that does not end.
Json::Value busy() {
    return apiError(OvraPlatform::APIError::kTooBusy,
                    "another flow changes credentials of the same node, nothing was done: try "
                    "again later");
}

/// Where other nodes reach this one; an error reply in `refusal` if there is no such place.
std::vector<Conn> localConns(Json::Value &refusal) {
    std::vector<Conn> conns = DRNode::getLocalConn();
    if (conns.empty()) {
        refusal =
            apiError(ERR::kBadParameter,
                     "this appliance has no address that others reach: bring an interface up, "
                     "or set address in its settings");
    }
    return conns;
}

/// The account of this appliance with whose rights another node comes back. Nobody gives away more
/// rights than he has.
std::string readLocalAccount(Params &in, const APICaller &caller) {
    constexpr char kName[] = "local_account";
    std::string named = in.optionalText(kName, Params::kMaxAccount);
    if (named.empty() && !caller.local) {
        return caller.user;
    }
    OvraPlatform::AccountStore accounts;
    const auto account = accounts.find(named);
    if (!account || !account->mayPair()) {
        in.refuse(kName, "local_account has to name an account of this appliance that may pair, "
                         "with whose rights the other node comes back; only a caller with a "
                         "session of its own may leave it out");
    } else if (named != caller.user && caller.role != Role::kAdministrator) {
        in.refuse(kName, "local_account is the account of somebody else: leave it out");
    }
    return named;
}

/// Has the node behind a credential create one back to this node.
bool reverse(CredReverseCreate &flow, const std::string &credId, const std::string &account,
             const std::vector<Conn> &conns) {
    return flow.setCredId(credId) && flow.setLocalAccount(account) && flow.addLocalConns(conns) &&
           flow.process() && flow.getCredInfo().isObject();
}

/// A credential in both directions is one unit: if the way back fails, the way there is removed
/// too.
Json::Value addReverse(Json::Value data, const std::string &credId, const std::string &account,
                       const std::vector<Conn> &conns) {
    CredReverseCreate flow;
    if (!reverse(flow, credId, account, conns)) {
        OVRA_NOTICE(
            "The credential [%s] is deleted again: none could be made back to this node. If "
            "the answer of the other node was lost, it holds one all the same: see `ovradr "
            "session list`",
            credId.c_str());
        DRNode record;
        if (!DRNodeDB::GetCred(credId, record) ||
            OvraApps::deleteCredential(record, false).state != FlowState::kDone) {
            OVRA_ERR("The credential [%s] could not be deleted: delete it by hand", credId.c_str());
        }
        return flowError(flow, ERR::kCredIncomplete);
    }
    data["dst_cred"] = flow.getCredInfo();
    return apiSuccess(data);
}

/// Creates the credential, unless it would be for this node itself.
/// \return an error reply; null if it was created
Json::Value carryOut(OvraDRNode::CredCreate &flow, const Proof &proof) {
    if (!proof.giveTo(flow) || !flow.getRemoteNodeInfo()) {
        return flowError(flow, ERR::kCredIncomplete);
    }
    if (flow.isLocalNode()) {
        return OvraPlatform::apiBadParameter("conn", "conn is this node itself: name another one");
    }
    switch (OvraApps::createCredential(flow)) {
    case FlowState::kDone:
        return {};
    case FlowState::kBusy:
        return busy();
    default:
        return flowError(flow, ERR::kCredIncomplete);
    }
}

Json::Value create(const Json::Value &params, const APICaller &caller) {
    Params in(params);
    const Proof proof(in, true);
    const std::string direction = in.word(kDirection, {kUnidirection, kBidirection});
    const bool bothWays = direction == kBidirection;
    const std::string account = bothWays ? readLocalAccount(in, caller) : "";
    if (!in.ok()) {
        return in.error();
    }
    Json::Value refusal;
    const std::vector<Conn> conns = bothWays ? localConns(refusal) : std::vector<Conn>();
    if (!refusal.isNull()) {
        return refusal;
    }
    OvraDRNode::DRNodeCredCreate flow;
    refusal = carryOut(flow, proof);
    if (!refusal.isNull()) {
        return refusal;
    }
    Json::Value data(Json::objectValue);
    data["src_cred"] = flow.getNode().toJson();
    return bothWays ? addReverse(data, flow.getNode().credId, account, conns) : apiSuccess(data);
}

OvraPlatform::APIQueue queueOfCreate(const Json::Value &params) {
    return OvraDRCore::memberString(params, kDirection) == kBidirection
               ? OvraPlatform::APIQueue::kTwoWay
               : OvraPlatform::APIQueue::kOutbound;
}

Json::Value createTemporary(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const Proof proof(in, false);
    if (!in.ok()) {
        return in.error();
    }
    OvraDRNode::TempCredCreate flow;
    const Json::Value refusal = carryOut(flow, proof);
    return refusal.isNull() ? apiSuccess(flow.getNode().toJson()) : refusal;
}

/// Whether the proof works at the other node and the account is known there; creates nothing.
Json::Value testCreate(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const Proof proof(in, true);
    const std::string account = proof.kind == Proof::Kind::kCredId
                                    ? std::string()
                                    : in.text("account", Params::kMaxAccount);
    if (!in.ok()) {
        return in.error();
    }
    OvraDRNode::DRNodeCredCreate flow;
    const bool works =
        proof.giveTo(flow) && (account.empty() || flow.setCredAccount(account)) && flow.check();
    return works ? apiSuccess() : flowError(flow, ERR::kCredCheckFailed);
}

Json::Value get(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const std::string credId = readCredId(in);
    if (!in.ok()) {
        return in.error();
    }
    DRNode record;
    return DRNodeDB::GetCred(credId, record) ? apiSuccess(record.toJson()) : noSuchCredential();
}

void appendRecords(Json::Value &list, const std::string &nodeId, DRNodeDB::CredType type) {
    std::vector<DRNode> records;
    if (nodeId.empty()) {
        DRNodeDB::List(records, type);
    } else {
        DRNodeDB::ListCred(nodeId, records, type);
    }
    for (const DRNode &record : records) {
        Json::Value entry = record.toJson();
        // The granting node's name for the session; it grants no access.
        entry["session_reference"] = OvraApps::referenceOf(record.session);
        entry["temporary"] = type == DRNodeDB::CRED_TYPE_TEMP;
        list.append(entry);
    }
}

/// The credentials to one node, or to all; the lasting ones first.
Json::Value list(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const std::string nodeId = in.optionalText("node_id", Params::kMaxId);
    if (!in.ok()) {
        return in.error();
    }
    // Unreadable tables read as empty ones, and a session audit would end those in use.
    auto database = OvraDRNode::NodeDBHandler::GetHandler();
    const int version = database.GetSchemaVersion();
    if (version < 0 || version > OvraDRNode::kNodeSchemaVersion) {
        return apiError(OvraPlatform::APIError::kInternal,
                        "the node database of the appliance cannot be read (" +
                            (version < 0 ? database.GetErrMsg().asString() : "it is newer") +
                            "): try again");
    }
    Json::Value data(Json::objectValue);
    data["creds"] = Json::Value(Json::arrayValue);
    appendRecords(data["creds"], nodeId, DRNodeDB::CRED_TYPE_NODE);
    appendRecords(data["creds"], nodeId, DRNodeDB::CRED_TYPE_TEMP);
    return apiSuccess(data);
}

/// A new log-in, perhaps over another endpoint, for an existing credential.
/// \param dryRun  whether it is only tried
Json::Value set(const Json::Value &params, bool dryRun) {
    Params in(params);
    const std::string credId = readCredId(in);
    const Conn conn = in.connHere();
    const RemoteLogin login(in);
    if (!in.ok()) {
        return in.error();
    }
    DRNode record;
    if (DRNodeDB::GetTempCred(credId, record)) {
        return OvraPlatform::apiBadParameter(
            "cred_id", "cred_id is a temporary credential: delete it and make a new one");
    }
    if (!DRNodeDB::GetCred(credId, record)) {
        return noSuchCredential();
    }
    OvraDRNode::DRNodeCredSet flow;
    const bool armed = flow.setCredId(credId) &&
                       flow.setCred(conn, login.account, login.password.get(), login.otpCode);
    if (!armed || (dryRun && !flow.check())) {
        return flowError(flow, ERR::kCredIncomplete);
    }
    if (dryRun) {
        return apiSuccess(record.toJson());
    }
    const OvraApps::FlowResult result = OvraApps::changeCredential(flow, record, conn);
    switch (result.state) {
    case FlowState::kDone:
        return apiSuccess(result.after.toJson());
    case FlowState::kGone:
        return noSuchCredential();
    case FlowState::kBusy:
        return busy();
    case FlowState::kFailed:
        break;
    }
    return flowError(flow, ERR::kCredIncomplete);
}

/// A missing credential counts as deleted.
Json::Value remove(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const std::string credId = readCredId(in);
    if (!in.ok()) {
        return in.error();
    }
    DRNode record;
    const bool temporary = DRNodeDB::GetTempCred(credId, record);
    if (!temporary && !DRNodeDB::GetCred(credId, record)) {
        record.credId = credId;
    }
    const OvraApps::FlowResult result = OvraApps::deleteCredential(record, temporary);
    if (result.state == FlowState::kBusy) {
        return busy();
    }
    if (result.state != FlowState::kDone) {
        return apiError(ERR::kFailed, "the credential cannot be deleted: see the log of the "
                                      "appliance, and check that its disk is not full");
    }
    Json::Value data;
    if (!result.before.session.empty()) {
        data["release"] = OvraApps::releaseWord(result.release.state);
    }
    return apiSuccess(data);
}

/// What the three reverse calls share.
/// \param run  carries out the flow
template <typename Flow, typename Run>
Json::Value runReverse(const Json::Value &params, const APICaller &caller, Run run) {
    Params in(params);
    const std::string credId = readCredId(in);
    std::vector<Conn> conns;
    if (in.has("conn")) {
        conns.push_back(in.conn("conn"));
    }
    const std::string account = readLocalAccount(in, caller);
    if (!in.ok()) {
        return in.error();
    }
    Flow flow;
    if (!flow.setCredId(credId)) {
        return noSuchCredential();
    }
    if (conns.empty()) {
        Json::Value refusal;
        conns = localConns(refusal);
        if (!refusal.isNull()) {
            return refusal;
        }
    }
    if (!flow.setLocalAccount(account) || !flow.addLocalConns(conns) || !run(flow)) {
        return flowError(flow, ERR::kCredIncomplete);
    }
    Json::Value data(Json::objectValue);
    if (flow.getCredInfo().isObject()) {
        data["dst_cred"] = flow.getCredInfo();
    }
    return apiSuccess(data);
}

template <typename Flow>
Json::Value createReverse(const Json::Value &params, const APICaller &caller) {
    return runReverse<Flow>(
        params, caller, [](Flow &flow) { return flow.process() && flow.getCredInfo().isObject(); });
}

Json::Value testReverse(const Json::Value &params, const APICaller &caller) {
    return runReverse<CredReverseCreate>(params, caller,
                                         [](CredReverseCreate &flow) { return flow.check(); });
}

/// Whether the caller may have it relayed. The next node judges it by the rights of this one's
/// account there, of which only an administrator may use all.
bool mayRelay(const APICaller &caller, const OvraDRCore::Request &request) {
    return caller.role == Role::kAdministrator || request.getAPI() == kNodeApi;
}

Json::Value relay(const Json::Value &params, const APICaller &caller) {
    Params in(params);
    const std::string credId = readCredId(in);
    const OvraDRCore::Request request(in.object("webapi"));
    if (!in.ok()) {
        return in.error();
    }
    if (request.isValid() && !mayRelay(caller, request)) {
        return apiError(OvraPlatform::APIError::kNoPermission,
                        "only requests of OVRA.DR.Node are relayed for this account: use an "
                        "administrator's account");
    }
    DRNode record;
    if (!DRNodeDB::GetCred(credId, record)) {
        return noSuchCredential();
    }
    RelayOperation operation(record, request);
    if (!operation.IsValidParam()) {
        return OvraPlatform::apiBadParameter(
            "webapi", "webapi has to be a request (api, method, version, params), and no relay");
    }
    if (operation.Run()) {
        return apiSuccess(operation.GetResult());
    }
    // The refusal of the node at the far end is the answer to the relayed request.
    return operation.GetErrCode() == ERR::kNoPrivilege
               ? apiError(OvraPlatform::APIError::kNoPermission,
                          "the credential lacks the right at its node")
               : apiError(operation.GetErrCode(), operation.GetErrMsg());
}

} // namespace

void addCredentialAPI(OvraPlatform::APIRegistry &registry) {
    using OvraPlatform::APIQueue;
    const auto add = [&registry](const char *method, APIQueue queue,
                                 const OvraPlatform::APIHandler &handler) {
        registry.add(kCredentialApi, 1, method, OvraPlatform::APIRight::kPairing, queue, handler);
    };
    add("get", APIQueue::kQuick, get);
    add("list", APIQueue::kQuick, list);
    registry.add(kCredentialApi, 1, "create", OvraPlatform::APIRight::kPairing, APIQueue::kTwoWay,
                 create, queueOfCreate);
    add("temp_create", APIQueue::kOutbound, createTemporary);
    add("test_create", APIQueue::kOutbound, testCreate);
    add("set", APIQueue::kOutbound,
        [](const Json::Value &params, const APICaller & /*caller*/) { return set(params, false); });
    add("test_set", APIQueue::kOutbound,
        [](const Json::Value &params, const APICaller & /*caller*/) { return set(params, true); });
    add("delete", APIQueue::kOutbound, remove);
    add("reverse_create", APIQueue::kTwoWay, createReverse<CredReverseCreate>);
    add("temp_reverse_create", APIQueue::kTwoWay, createReverse<OvraDRNode::TempCredReverseCreate>);
    add("test_reverse_create", APIQueue::kTwoWay, testReverse);
    add(kRelay, APIQueue::kRelay, relay);
}

} // namespace Ovradrd
