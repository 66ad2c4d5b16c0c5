// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/sender.h"

#include "transport/conn_cache.h"
#include "transport/request_scope.h"
#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovrawebapi/api_runner.h>

#include <algorithm>
#include <ctime>
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
    const std::time_t start = std::time(nullptr);
    const ProbeResult probe = IsConnectableWithErrCheck(conn);
    const std::time_t now = std::time(nullptr);
    // A process that was stopped in its probe has old news, and other processes may know better.
    const std::time_t end = std::min(now, start + OvraDRCore::Cache::kLongestRefresh);
    if (!probe.ran) {
        OVRA_NOTICE("Failed to check connectable of conn[%s]",
                    OvraDRCore::toString(conn.toJson()).c_str());
    }
    if (probe.lacked) {
        return false;
    }
    const ConnCache cache(conn);
    cache.logChange(__func__, cache.getStoredVerdict(), probe.connectable);
    const double age = cache.GetCachedAge();
    if (end == now || age < 0 || age > std::difftime(now, end)) {
        cache.UpdateWithData(probe.connectable, start, end);
    }
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
