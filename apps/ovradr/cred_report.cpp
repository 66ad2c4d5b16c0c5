// SPDX-License-Identifier: Apache-2.0
#include "cred_report.h"

#include "output.h"
#include "target.h"

namespace Ovradr {

using OvraApps::Release;
using OvraDRNode::DRNode;
namespace ERR = OvraDRCore::ERR;

Json::Value credJson(const DRNode &record, bool temporary) {
    Json::Value json;
    json["cred_id"] = record.credId;
    json["node_id"] = record.nodeId;
    json["endpoint"] = targetText(record.conn);
    json["temporary"] = temporary;
    return json;
}

std::string credText(const DRNode &record, bool temporary, const std::string &account) {
    return listing({{"credential", record.credId},
                    {"node", record.nodeId},
                    {"endpoint", targetText(record.conn)},
                    {"account", account},
                    {"kind", temporary ? "temporary" : "lasting"}});
}

std::string releaseText(const Release &release, bool foreseen) {
    switch (release.state) {
    case Release::State::kReleased:
        return foreseen ? "would be released on the other appliance"
                        : "released on the other appliance";
    case Release::State::kEndedAlready:
        return "had ended on the other appliance already";
    case Release::State::kKept:
        return foreseen ? "would be kept, because another credential uses it"
                        : "kept, because another credential uses it";
    case Release::State::kLeft:
        break;
    }
    const std::string why = failureOf(release.code, release.detail).value().message;
    if (foreseen) {
        return "would be left behind: " + why;
    }
    return "left behind: " + why +
           (release.remembered ? " ovradrd tries again; see `ovradr session pending`."
                               : " Nobody tries again: revoke it on the other appliance.");
}

Refusal credFlowFailure(const OvraDRCore::ErrRecorder &flow,
                        const OvraDRCore::ErrRecorder &sessionError, const OvraDRNode::Conn &conn) {
    Refusal found = failureOf(sessionError.GetErrCode() != ERR::kNone ? sessionError : flow);
    if (flow.GetErrCode() == ERR::kNotConnectable) {
        addReason(found.value(), conn);
    } else {
        nameEndpoint(found.value(), conn);
    }
    return found;
}

Refusal busyFailure() {
    return failure(ExitCode::kFailed,
                   "Another command changes credentials of the same node and does not end.",
                   "Nothing was changed. Wait for it or end it, and try again.");
}

void addRelease(Json::Value &data, const Release &release) {
    data["session"] = OvraApps::releaseWord(release.state);
    if (release.state != Release::State::kLeft) {
        return;
    }
    const Failure why = failureOf(release.code, release.detail).value();
    data["reason"]["code"] = why.code;
    data["reason"]["name"] = why.name;
    data["reason"]["message"] = why.message;
    data["retried"] = release.remembered;
}

} // namespace Ovradr
