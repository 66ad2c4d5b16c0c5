// SPDX-License-Identifier: Apache-2.0
#include "shared/session_release.h"

#include "shared/remote_session.h"
#include "shared/session_lock.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/log.h>
#include <ovradrnode/cred_utils.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/node_delete.h>
#include <ovraplatform/api_errors.h>

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
        release.state == Release::State::kLeft && store.postpone(pending, release.code);
    if (release.state != Release::State::kLeft) {
        (void)store.remove(pending); // what stays is found settled when it is due
    }
}

PendingRelease noteFor(const DRNode &record, const std::string &session, const Conn &conn) {
    PendingRelease pending;
    pending.session = session;
    pending.conn = conn;
    pending.nodeId = record.nodeId;
    pending.credId = record.credId;
    return pending;
}

bool readRow(const std::string &credId, bool temporary, DRNode &row) {
    return temporary ? DRNodeDB::GetTempCred(credId, row) : DRNodeDB::GetCred(credId, row);
}

/// Runs a flow that makes the session of a row superfluous and releases it if it can.
/// \param record    the row as read before
/// \param conn      the endpoint over which the flow releases; invalid: that of the row
/// \param mustExist  whether the flow needs the row
template <typename Flow>
FlowResult runWithRelease(const DRNode &record, bool temporary, const Conn &conn, bool mustExist,
                          Flow flow) {
    const auto hadEnded = [&conn](DRNode row) {
        row.conn = conn.isValid() ? conn : row.conn;
        return predictRelease(row).state == Release::State::kEndedAlready;
    };
    bool ended = hadEnded(record); // takes long if the node is silent, so better without the lock
    const SessionLock lock(record.nodeId, SessionLock::Purpose::kRelease);
    FlowResult result;
    if (lock.isBusy()) {
        result.state = FlowState::kBusy;
        return result;
    }
    DRNode &row = result.before;
    if (!readRow(record.credId, temporary, row)) {
        if (mustExist) {
            result.state = FlowState::kGone;
            return result;
        }
        row = DRNode();
    }
    if (row.session != record.session) {
        ended = hadEnded(row);
    }
    const Conn &over = conn.isValid() ? conn : row.conn;
    const PendingRelease pending = noteFor(row, row.session, over);
    PendingReleases store;
    const bool noted = !row.session.empty() && over.isValid() && store.note(pending);
    if (!flow()) {
        // The credential needs its session; a note that stays is found so.
        (void)store.remove(pending);
        return result;
    }
    result.state = FlowState::kDone;
    result.release = lookAfter(over, row.session,
                               ended ? Release::State::kEndedAlready : Release::State::kReleased);
    if (noted) {
        recordOutcome(store, pending, result.release);
    }
    if (!readRow(record.credId, temporary, result.after)) {
        result.after = DRNode();
    }
    return result;
}

/// Runs a flow that obtains a session, which is noted while no row uses it: whoever kills this
/// process then leaves the note. If the flow fails, it is released later.
/// \param record  has the credential's id
template <typename Flow, typename Run>
bool runWithGrant(Flow &flow, const DRNode &record, const Conn &conn, Run run) {
    PendingReleases store;
    bool noted = false;
    flow.setGrantObserver(
        [&](const std::string &session) { noted = store.note(noteFor(record, session, conn)); });
    const bool done = run();
    flow.setGrantObserver({});
    const PendingRelease pending = noteFor(record, flow.getGrantedSession(), conn);
    if (done) {
        (void)store.remove(pending); // one that stays is found in use
    } else if (!noted && !pending.session.empty()) {
        OVRA_ERR("The session [%s] at node [%s] is left behind: end it there",
                 pending.reference().c_str(), pending.nodeId.c_str());
    }
    return done;
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

FlowState createCredential(OvraDRNode::CredCreate &flow) {
    const SessionLock lock(flow.getNode().nodeId, SessionLock::Purpose::kObtain);
    if (lock.isBusy()) {
        return FlowState::kBusy;
    }
    const DRNode &record = flow.getNode();
    const bool done =
        runWithGrant(flow, record, record.conn, [&flow] { return flow.processKnownNode(); });
    return done ? FlowState::kDone : FlowState::kFailed;
}

FlowResult changeCredential(OvraDRNode::DRNodeCredSet &flow, const DRNode &record,
                            const Conn &conn) {
    return runWithRelease(record, false, conn, true, [&] {
        if (!flow.setCredId(record.credId)) {
            return false;
        }
        flow.setStoredConn(conn);
        return runWithGrant(flow, record, conn, [&flow] { return flow.process(); });
    });
}

FlowResult deleteCredential(const DRNode &record, bool temporary) {
    return runWithRelease(record, temporary, Conn(), false, [&record, temporary] {
        return temporary ? OvraDRNode::TempCredDelete(record.credId).process()
                         : OvraDRNode::DRNodeCredDelete(record.credId).process();
    });
}

Release retryRelease(const PendingRelease &pending, PendingReleases &store, unsigned int patience) {
    const SessionLock lock(pending.nodeId, SessionLock::Purpose::kRelease, patience);
    if (lock.isBusy()) {
        Release busy = left(OvraPlatform::APIError::kTooBusy);
        busy.remembered = store.postpone(pending, busy.code);
        return busy;
    }
    DRNode record;
    const bool inUse = DRNodeDB::GetCred(pending.credId, record) &&
                       record.session == pending.session; // its flow was killed before it changed
    Release result{Release::State::kKept, 0, {}, false};
    if (!inUse) {
        const auto now = look(pending.conn, pending.session, "", Release::State::kReleased);
        if (!now) {
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
