// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/sender.h"

#include "transport/conn_cache.h"
#include "transport/request_scope.h"
#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovrawebapi/api_runner.h>

#include <cstdint>
#include <utility>

namespace OvraDRNode {

using OvraDRCore::Request;
using OvraDRCore::Response;

BaseSender::~BaseSender() = default;

Response BaseSender::run(const Request &request) {
    Json::Value reply;
    OVRA::APIRunner().Exec(reply, request.getAPI().c_str(), request.getVersion(),
                           request.getMethod().c_str(), request.getParams(), Word::kLocalUser);
    Response response;
    response.setResp(std::move(reply));
    return response;
}

OvraDRCore::ErrRecorder errorOf(const OvraDRCore::ErrRecorder &sender, const Response &answer) {
    OvraDRCore::ErrRecorder error;
    if (!answer.isValid() && sender.GetErrCode() != OvraDRCore::ERR::kNone) {
        error.SetErr(&sender);
    } else {
        error.SetErr(answer.getErrCode(), answer.getErrMsg()); // 407 for an invalid one
    }
    return error;
}

bool BaseSender::IsConnectable(const Conn &conn) {
    const std::int64_t start = OvraDRCore::Cache::Now();
    const ProbeResult probe = IsConnectableWithErrCheck(conn);
    if (!probe.ran) {
        OVRA_NOTICE("Failed to check connectable of conn[%s]",
                    OvraDRCore::toString(conn.toJson()).c_str());
    }
    if (probe.lacked) {
        return false;
    }
    const ConnCache cache(conn);
    cache.logChange(__func__, cache.getStoredVerdict(), probe.connectable);
    cache.UpdateWithFinding(probe.connectable, start);
    return probe.connectable;
}

bool BaseSender::GetCachedConnectable(const Conn &conn) {
    if (RequestScope::isUnreachable(conn)) {
        return false;
    }
    const ConnCache cache(conn);
    const Json::Value verdict = cache.Read();
    return !cache.IsValid(verdict) || verdict.asBool();
}

} // namespace OvraDRNode
