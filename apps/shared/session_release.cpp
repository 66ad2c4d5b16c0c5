// SPDX-License-Identifier: Apache-2.0
#include "shared/session_release.h"

#include "shared/remote_session.h"
#include "shared/session_lock.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/log.h>
#include <ovradrnode/cred_utils.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/node_delete.h>

#include <optional>

namespace OvraApps {

using OvraDRNode::Conn;
using OvraDRNode::DRNode;
using OvraDRNode::DRNodeDB;

namespace {

Release left(int code, const Json::Value &detail = Json::Value()) {
    return {Release::State::kLeft, code, detail, false};
}

/// The current state; std::nullopt if the session is accepted and no credential uses it.
/// \param whenGone  how a session that is gone counts
std::optional<Release> look(const Conn &conn, const std::string &session,
                            const std::string &exceptCredId, Release::State whenGone) {
    if (session.empty()) {
        return Release{Release::State::kEndedAlready, 0, {}, false};
    }
    const int users = OvraDRNode::CredUtils::GetSessionUsedCount(session, exceptCredId);
    if (users < 0) {
        return left(OvraDRCore::ERR::kFailed);
    }
    if (users > 0) {
        return Release{Release::State::kKept, 0, {}, false};
    }
    const SessionAnswer answer = askSession(conn, session);
    switch (answer.state) {
    case SessionState::kLive:
        return std::nullopt;
    case SessionState::kGone:
        return Release{whenGone, 0, {}, false};
    default:
        return left(answer.code, answer.detail);
    }
}

/// After it was to be released.
Release lookAfter(const Conn &conn, const std::string &session, Release::State whenGone) {
    return look(conn, session, "", whenGone).value_or(left(OvraDRCore::ERR::kSessionNotRemoved));
}

/// Updates the note to what happened to the session.
void recordOutcome(PendingReleases &store, const PendingRelease &pending, Release &release) {
    release.remembered =
        release.state == Release::State::kLeft && store.postpone(pending.reference(), release.code);
    if (release.state != Release::State::kLeft) {
        (void)store.remove(pending.reference()); // what stays is found settled when it is due
    }
}

} // namespace

const char *releaseWord(Release::State state) {
    switch (state) {
    case Release::State::kReleased:
        return "released";
    case Release::State::kEndedAlready:
        return "ended_already";
    case Release::State::kKept:
        return "kept";
    case Release::State::kLeft:
        break;
    }
    return "left_behind";
}

Release predictRelease(const DRNode &record) {
    return look(record.conn, record.session, record.credId, Release::State::kEndedAlready)
        .value_or(Release{Release::State::kReleased, 0, {}, false});
}

FlowResult runWithRelease(const DRNode &record, const Conn &conn,
                          const std::function<bool()> &flow) {
    DRNode superfluous = record;
    superfluous.conn = conn;
    const bool wasGone = predictRelease(superfluous).state == Release::State::kEndedAlready;
    const PendingRelease pending{record.session, conn, record.nodeId, record.credId};
    PendingReleases store;
    const bool noted = !record.session.empty() && conn.isValid() && store.note(pending);
    FlowResult result;
    {
        const SessionLock lock(SessionLock::Purpose::kRelease);
        result.done = flow();
    }
    if (!result.done) {
        // The credential is as it was, and needs its session; a note that stays is found so.
        (void)store.remove(pending.reference());
        return {false, {Release::State::kKept, 0, {}, false}};
    }
    result.release = lookAfter(conn, record.session,
                               wasGone ? Release::State::kEndedAlready : Release::State::kReleased);
    if (noted) {
        recordOutcome(store, pending, result.release);
    }
    return result;
}

FlowResult deleteCredential(const DRNode &record, bool temporary) {
    return runWithRelease(record, record.conn, [&record, temporary] {
        return temporary ? OvraDRNode::TempCredDelete(record.credId).process()
                         : OvraDRNode::DRNodeCredDelete(record.credId).process();
    });
}

Release retryRelease(const PendingRelease &pending, PendingReleases &store) {
    DRNode record;
    const bool inUse = DRNodeDB::GetCred(pending.credId, record) &&
                       record.session == pending.session; // its flow was killed before it changed
    Release result{Release::State::kKept, 0, {}, false};
    if (!inUse) {
        const auto now = look(pending.conn, pending.session, "", Release::State::kReleased);
        if (!now) {
            const SessionLock lock(SessionLock::Purpose::kRelease);
            // Its result is checked below.
            (void)OvraDRNode::CredUtils::NotifyRemoteNodeDeleteSessionIfNotUsed(pending.conn,
                                                                                pending.session);
        }
        result = now ? *now : lookAfter(pending.conn, pending.session, Release::State::kReleased);
    }
    recordOutcome(store, pending, result);
    OVRA_NOTICE("The session [%s] at node [%s] is [%s], attempt [%d]", pending.reference().c_str(),
                pending.nodeId.c_str(), releaseWord(result.state), pending.attempts + 1);
    return result;
}

} // namespace OvraApps
