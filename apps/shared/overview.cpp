// SPDX-License-Identifier: Apache-2.0
#include "shared/overview.h"

#include "shared/node_names.h"
#include "shared/pending_releases.h"

#include <ovrabase/address.h>
#include <ovradrcore/json.h>
#include <ovradrnode/node_cache.h>
#include <ovradrnode/node_candidates.h>
#include <ovradrnode/node_session.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/peer_trust.h>
#include <ovraplatform/session_store.h>

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <tuple>
#include <utility>
#include <vector>

namespace OvraApps {

namespace {

namespace APIError = OvraPlatform::APIError;
namespace ERR = OvraDRCore::ERR;
using OvraDRNode::CachedVerdict;
using OvraDRNode::Conn;
using OvraDRNode::DRNode;
using OvraDRNode::NodeCandidate;
using OvraDRNode::NodeSession;
using OvraPlatform::SessionRecord;
using Outlook = NodeCandidate::Outlook;

/// A release that has been tried for so long has a node that is gone for good.
constexpr std::int64_t kPatience = std::int64_t{7} * 24 * 3600;
constexpr std::size_t kMostProblems = 1000;
/// Bounds what one reply holds: peers, ways and sessions together.
constexpr std::size_t kMostParts = 12'000;
constexpr std::size_t kShortId = 8;

/// The exit codes of `ovradr`, by which a problem is told apart.
enum Exit : int {
    kFailed = 1,
    kNotReachable = 3,
    kLoginRefused = 4,
    kKey = 6,
    kNotPermitted = 8,
    kNotSetUp = 9,
    kWrongNode = 12,
    kClock = 13,
};

/// How much a problem takes away; the gravest come first.
enum class Rank { kOwn, kNode, kWay, kNote };

struct Problem {
    Rank rank;
    const char *kind;
    int exit;
    std::string message;
    std::string hint;
    std::string command; ///< "" if none mends it
    std::string nodeId;
    std::string credId;
};

/// What is known of a way: what the daemon found, else what the caches hold; all may be unknown.
struct WayState {
    std::optional<bool> answers;
    std::int64_t asked = 0;
    std::int64_t since = 0;
    std::int64_t lastSeen = 0;
    const WayFacts *facts = nullptr;

    bool isDown() const { return answers == false; }
};

/// A credential, and what is known of it.
struct Way : NodeCandidate {
    WayState state;
};

struct Peer {
    std::string id;
    NodeName name;
    std::vector<Way> ways;
    std::vector<const SessionRecord *> sessions;
    std::vector<Problem> problems;
    std::string sortKey;

    std::string text() const { return name.shown().empty() ? id : name.shown(); }
    Rank rank() const { return problems.empty() ? Rank::kNote : problems.front().rank; }
};

std::string endpointText(const Conn &conn) {
    const std::string known = OvraPlatform::trustKey(conn.protocol, conn.addr, conn.port);
    return known.empty() ? conn.protocol + ":" + conn.addr : known;
}

std::string shortId(const std::string &id) {
    return id.substr(0, kShortId);
}

std::string tenths(double number) {
    std::array<char, 64> text{};
    std::snprintf(text.data(), text.size(), "%.1f", number);
    return text.data();
}

class Maker {
public:
    explicit Maker(const OverviewRequest &request)
        : request_(request) {}

    Json::Value make() {
        readSessions();
        readPeers();
        for (auto &peer : peers_) {
            judge(peer);
        }
        std::sort(peers_.begin(), peers_.end(), [](const Peer &left, const Peer &right) {
            return std::tuple(left.problems.empty(), left.rank(), left.sortKey) <
                   std::tuple(right.problems.empty(), right.rank(), right.sortKey);
        });
        Json::Value document(Json::objectValue);
        document["time"] = Json::Int64{now_};
        document["node"] = ownNode();
        document["pending_releases"] = pending();
        addPeers(document);
        addProblems(document);
        return document;
    }

private:
    void readSessions() {
        if (access(OvraPlatform::kSessionsFile, R_OK) != 0) {
            return; // it would be made
        }
        std::vector<SessionRecord> records;
        OvraPlatform::SessionStore store;
        if (!store.isOpen() || !store.list(records)) {
            own("store", kNotSetUp, store.error(), "");
            return;
        }
        std::erase_if(records, [](const SessionRecord &record) {
            return record.app != NodeSession::kApplication;
        });
        sessions_ = std::move(records);
    }

    void readPeers() {
        std::map<std::string, Peer> byId;
        for (auto &[id, ways] : OvraDRNode::listAllNodeCandidates()) {
            for (NodeCandidate &way : ways) {
                const WayState state = stateOf(way);
                byId[id].ways.push_back({std::move(way), state});
            }
        }
        for (const SessionRecord &session : sessions_) {
            const std::string id = NodeSession::NodeIdOf(session.extra);
            if (id.empty() || DRNode::isLocalNodeId(id)) {
                loose_.push_back(&session);
            } else {
                byId[id].sessions.push_back(&session);
            }
        }
        localId_ = DRNode::getLocalNodeId();
        std::set<std::string> ids{localId_};
        for (const auto &[id, peer] : byId) {
            ids.insert(id);
        }
        const NodeNames names(ids);
        localName_ = names.of(localId_);
        for (auto &[id, peer] : byId) {
            peer.id = id;
            peer.name = names.of(id);
            peer.sortKey = OvraBase::toLower(peer.name.shown()) + '\n' + id;
            peers_.push_back(std::move(peer));
        }
        if (const auto entries = OvraPlatform::TrustStore().list()) {
            for (const auto &entry : *entries) {
                keys_.emplace(entry.endpoint, entry);
            }
        }
        if (const std::string problem = OvraPlatform::TrustStore().problem(); !problem.empty()) {
            own("trusted_keys", kNotSetUp,
                std::string(OvraPlatform::kKnownEndpointsFile) +
                    " cannot be relied on: " + problem + ".",
                "Endpoints that it does not name are refused: restore it from a backup, or correct "
                "it and run `ovradr conn trust` for each.",
                "ovradr conn trust URL");
        }
    }

    void own(const char *kind, int exit, const std::string &message, const std::string &hint,
             const std::string &command = "") {
        problems_.push_back({Rank::kOwn, kind, exit, message, hint, command, "", ""});
    }

    WayState stateOf(const NodeCandidate &way) const {
        WayState state;
        if (request_.daemon != nullptr) {
            const auto found = request_.daemon->ways.find(way.node.credId);
            state.facts = found == request_.daemon->ways.end() ? nullptr : &found->second;
        }
        const CachedVerdict &verdict = way.reachable;
        if (verdict.known && verdict.age >= 0) {
            state.answers = verdict.value;
            state.asked = now_ - std::llround(verdict.age);
            state.lastSeen = verdict.value ? state.asked : 0;
        }
        if (state.facts != nullptr) {
            // The younger says how it is, whoever asked.
            if (state.facts->asked >= state.asked) {
                state.answers = state.facts->answers;
                state.asked = state.facts->asked;
            }
            state.since = state.answers == state.facts->answers ? state.facts->since : 0;
            state.lastSeen = std::max(state.lastSeen, state.facts->lastSeen);
        }
        return state;
    }

    // Problems of a peer.

    static void add(Peer &peer, Rank rank, const char *kind, int exit, const std::string &message,
                    const std::string &hint, const std::string &command,
                    const std::string &credId = "") {
        peer.problems.push_back({rank, kind, exit, message, hint, command, peer.id, credId});
    }

    static void judge(Peer &peer) {
        const auto isDown = [](const Way &way) {
            return way.state.isDown() && !isKeyProblem(way.state);
        };
        const bool allDown =
            !peer.ways.empty() && std::all_of(peer.ways.begin(), peer.ways.end(), isDown);
        if (allDown) {
            add(peer, Rank::kNode, "not_reachable", kNotReachable,
                peer.text() + " does not answer (" + endpointText(peer.ways.front().node.conn) +
                    ").",
                "`ovradr doctor` says what is in the way.", "ovradr doctor " + shellWord(peer.id));
        }
        bool clockTold = false;
        for (const Way &way : peer.ways) {
            const WayFacts *const facts = way.state.facts;
            if (way.outlook == Outlook::kInvalid) {
                add(peer, Rank::kWay, "incomplete", kNotSetUp,
                    "The credential " + shortId(way.node.credId) + " of " + peer.text() +
                        " is not complete.",
                    "Delete it, and pair with the node again.",
                    "ovradr cred delete " + shellWord(way.node.credId), way.node.credId);
                continue;
            }
            if (isDown(way) && !allDown) {
                const std::string endpoint = endpointText(way.node.conn);
                add(peer, Rank::kWay, "spare_way", kNotReachable,
                    "A spare way to " + peer.text() + " does not answer (" + endpoint + ").",
                    "`ovradr doctor` says what is in the way.",
                    "ovradr doctor " + shellWord(endpoint), way.node.credId);
            }
            if (facts != nullptr) {
                clockTold = clockTold || judgeClock(peer, *facts);
                judgeAnswer(peer, way, *facts);
            }
        }
        std::stable_sort(
            peer.problems.begin(), peer.problems.end(),
            [](const Problem &left, const Problem &right) { return left.rank < right.rank; });
    }

    static bool isKeyProblem(const WayState &state) {
        return state.facts != nullptr && state.facts->code == ERR::kCertificateChanged;
    }

    static bool judgeClock(Peer &peer, const WayFacts &facts) {
        if (!facts.clockAhead || std::abs(*facts.clockAhead) <= kMaxClockSeconds) {
            return false;
        }
        add(peer, Rank::kWay, "clock", kClock,
            "The clock of " + peer.text() + " is " + tenths(std::abs(*facts.clockAhead)) + " s " +
                (*facts.clockAhead < 0 ? "behind" : "ahead of") + " this one.",
            "Set both by NTP: one-time codes need clocks that agree.",
            "ovradr doctor " + shellWord(peer.id));
        return true;
    }

    static void judgeAnswer(Peer &peer, const NodeCandidate &way, const WayFacts &facts) {
        // If it is the way that requests take, they fail.
        const Rank rank = way.outlook == Outlook::kNext ? Rank::kNode : Rank::kWay;
        const std::string &credId = way.node.credId;
        const std::string endpoint = endpointText(way.node.conn);
        const std::string renew = way.temporary
                                      ? "ovradr cred delete " + shellWord(credId)
                                      : "ovradr cred set " + shellWord(credId) + " --account NAME";
        if (!facts.nodeId.empty() && facts.nodeId != peer.id) {
            add(peer, rank, "wrong_node", kWrongNode,
                endpoint + " is the node \"" + facts.nodeId + "\", not " + peer.text() + ".",
                "Its address went to another appliance, or its node id was reset: pair with it "
                "again.",
                "ovradr cred create " + shellWord(endpoint) + " --account NAME", credId);
            return;
        }
        switch (facts.code) {
        case 0:
        case ERR::kNotConnectable:
            return;
        case APIError::kNoSession:
            add(peer, rank, "no_session", kLoginRefused,
                peer.text() + " no longer knows the session of the credential " + shortId(credId) +
                    ".",
                way.temporary ? "It has ended, as those of temporary credentials do: delete it."
                              : "Log in there again.",
                renew, credId);
            return;
        case APIError::kNoPermission:
        case ERR::kNoPrivilege:
            add(peer, rank, "no_permission", kNotPermitted,
                peer.text() + " does not permit requests with the credential " + shortId(credId) +
                    ".",
                "Use an account that is an administrator there, and is not disabled.", renew,
                credId);
            return;
        case ERR::kCertificateChanged:
            add(peer, rank, "certificate_changed", kKey,
                "The key of " + peer.text() + " at " + endpoint +
                    " is not the one that was trusted for it.",
                "Find out why it changed before you trust the new one.",
                "ovradr conn trust " + shellWord(endpoint), credId);
            return;
        default:
            add(peer, rank, "request_failed", kFailed,
                "A request to " + peer.text() + " over " + endpoint + " fails with error " +
                    std::to_string(facts.code) +
                    (facts.reason.empty() ? "." : " (" + facts.reason + ")."),
                "`ovradr doctor` says what is in the way.", "ovradr doctor " + shellWord(peer.id),
                credId);
        }
    }

    // The document.

    Json::Value ownNode() const {
        Json::Value node(Json::objectValue);
        node["node_id"] = localId_;
        node["name"] = localName_.shown();
        node["hostname"] = localName_.host;
        if (!localName_.comment.empty()) {
            node["comment"] = localName_.comment;
        }
        node["serial"] = DRNode::getLocalSerial();
        node["version"] = request_.version;
        if (request_.daemon != nullptr) {
            node["daemon_since"] = Json::Int64{request_.daemon->since};
        }
        node["endpoints"] = Json::Value(Json::arrayValue);
        for (const Conn &conn : Conn::listLocal()) {
            Json::Value endpoint = conn.toJson();
            const std::string &key = conn.protocol == "http" ? request_.httpKey : request_.httpsKey;
            if (!key.empty()) {
                endpoint["fingerprint"] = key;
            }
            node["endpoints"].append(std::move(endpoint));
        }
        return node;
    }

    Json::Value wayJson(const Way &way) const {
        const WayState &state = way.state;
        Json::Value json = way.node.conn.toJson();
        json["cred_id"] = way.node.credId;
        json["temporary"] = way.temporary;
        json["use"] = way.toJson()["outlook"];
        addReach(json, state);
        if (way.privilege.known) {
            json["privilege"] = way.privilege.value;
        }
        if (state.facts != nullptr && state.facts->code != 0) {
            json["code"] = state.facts->code;
        }
        if (state.facts != nullptr && state.facts->ends) {
            json["ends"] = Json::Int64{*state.facts->ends};
        }
        const auto key = keys_.find(endpointText(way.node.conn));
        if (key != keys_.end()) {
            json["trusted"] = key->second.value;
            if (key->second.since > 0) {
                json["trusted_since"] = Json::Int64{key->second.since};
            }
        }
        return json;
    }

    static void addReach(Json::Value &json, const WayState &state) {
        if (!state.answers) {
            return;
        }
        json["answers"] = *state.answers;
        json["asked"] = Json::Int64{state.asked};
        if (state.since > 0) {
            json["since"] = Json::Int64{state.since};
        }
        if (state.lastSeen > 0) {
            json["last_seen"] = Json::Int64{state.lastSeen};
        }
        if (*state.answers && state.facts != nullptr && state.facts->latency >= 0) {
            json["latency"] = std::round(state.facts->latency * 100) / 100;
        }
    }

    /// How the node is reached: as the way that a request would take, else by what all of them say.
    static WayState reachOf(const Peer &peer) {
        WayState all;
        for (const Way &way : peer.ways) {
            const WayState &state = way.state;
            const bool better = state.answers == true && all.answers != true;
            const bool lastToGo = state.isDown() && all.answers != true && state.since >= all.since;
            const std::int64_t lastSeen = std::max(all.lastSeen, state.lastSeen);
            if (better || lastToGo) {
                all = state;
            }
            all.lastSeen = lastSeen;
        }
        const bool oneUnknown = std::any_of(peer.ways.begin(), peer.ways.end(),
                                            [](const Way &way) { return !way.state.answers; });
        if (all.isDown() && oneUnknown) {
            all.answers.reset();
        }
        return all;
    }

    Json::Value sessionJson(const SessionRecord &session) const {
        Json::Value json(Json::objectValue);
        const std::string reference = session.reference();
        json["reference"] = reference;
        json["account"] = session.user;
        json["since"] = Json::Int64{session.created};
        if (session.expires) {
            json["ends"] = Json::Int64{*session.expires};
        }
        if (!session.remote.empty()) {
            json["granted_to"] = session.remote;
        }
        if (request_.daemon != nullptr) {
            const auto use = request_.daemon->uses.find(reference);
            if (use != request_.daemon->uses.end()) {
                json["last_used"] = Json::Int64{use->second.last};
                json["client"] = use->second.client;
            }
        }
        return json;
    }

    Json::Value peerJson(const Peer &peer) const {
        Json::Value json(Json::objectValue);
        json["node_id"] = peer.id;
        json["name"] = peer.name.shown();
        if (!peer.name.host.empty()) {
            json["hostname"] = peer.name.host;
        }
        if (!peer.name.comment.empty()) {
            json["comment"] = peer.name.comment;
        }
        addFacts(json, peer);
        if (!peer.ways.empty()) {
            Json::Value &reach = json["reach"] = Json::Value(Json::objectValue);
            addReach(reach, reachOf(peer));
            reach["ways"] = Json::Value(Json::arrayValue);
            for (const Way &way : peer.ways) {
                reach["ways"].append(wayJson(way));
            }
        }
        json["reached_by"] = Json::Value(Json::arrayValue);
        for (const SessionRecord *session : peer.sessions) {
            json["reached_by"].append(sessionJson(*session));
        }
        json["problems"] = Json::UInt64{peer.problems.size()};
        return json;
    }

    /// What the node said about itself.
    static void addFacts(Json::Value &json, const Peer &peer) {
        const Json::Value info = OvraDRNode::NodeCache(peer.id, false).GetCachedData();
        if (const std::string serial = OvraDRCore::memberString(info, "serial"); !serial.empty()) {
            json["serial"] = serial;
        }
        for (const Way &way : peer.ways) {
            const WayFacts *const facts = way.state.facts;
            if (facts == nullptr || facts->nodeId != peer.id) {
                continue;
            }
            if (!facts->version.empty()) {
                json["version"] = facts->version;
            }
            if (facts->clockAhead) {
                json["clock_ahead"] = std::round(*facts->clockAhead * 1000) / 1000;
            }
            return;
        }
    }

    Json::Value pending() {
        Json::Value list(Json::arrayValue);
        if (access(kPendingReleasesFile, R_OK) != 0) {
            return list; // it would be made
        }
        PendingReleases store;
        std::vector<PendingRelease> releases;
        if (!store.isOpen() || !store.list(releases)) {
            own("store", kNotSetUp, store.error(), "");
            return list;
        }
        std::set<std::string> ids;
        for (const PendingRelease &release : releases) {
            ids.insert(release.nodeId);
        }
        const NodeNames names(ids);
        for (const PendingRelease &release : releases) {
            const std::string &name = names.of(release.nodeId).shown();
            Json::Value json = release.conn.toJson();
            json["reference"] = release.reference();
            json["node_id"] = release.nodeId;
            json["name"] = name;
            json["since"] = Json::Int64{release.noted};
            json["attempts"] = release.attempts;
            json["next_try"] = Json::Int64{release.nextTry};
            json["code"] = release.code;
            list.append(std::move(json));
            if (release.attempts > 0 && release.noted < now_ - kPatience) {
                problems_.push_back(
                    {Rank::kNote, "pending_release", kFailed,
                     "A session on " + (name.empty() ? release.nodeId : name) +
                         " has been waiting for its release for more than a week.",
                     "If the node is gone for good, forget it; else see that it answers.",
                     "ovradr session pending --forget " + release.reference(), release.nodeId,
                     release.credId});
            }
        }
        return list;
    }

    void addPeers(Json::Value &document) {
        Json::Value &list = document["peers"] = Json::Value(Json::arrayValue);
        Json::Value &temporary = document["temporary"] = Json::Value(Json::arrayValue);
        Json::UInt64 answering = 0;
        for (const Peer &peer : peers_) {
            answering += reachOf(peer).answers == true ? 1U : 0U;
            for (const Way &way : peer.ways) {
                if (way.temporary && temporary.size() < kMostProblems) {
                    Json::Value json = wayJson(way);
                    json["node_id"] = peer.id;
                    json["name"] = peer.name.shown();
                    temporary.append(std::move(json));
                }
            }
        }
        std::size_t parts = 0;
        std::size_t at = std::min(request_.offset, peers_.size());
        for (; at < peers_.size() && list.size() < request_.limit && parts < kMostParts; ++at) {
            list.append(peerJson(peers_[at]));
            parts += 1 + peers_[at].ways.size() + peers_[at].sessions.size();
        }
        if (at < peers_.size()) {
            document["next"] = Json::UInt64{at};
        }
        document["peer_count"] = Json::UInt64{peers_.size()};
        document["answering_count"] = answering;
        Json::Value &loose = document["temporary_sessions"] = Json::Value(Json::arrayValue);
        for (std::size_t i = 0; i < std::min(loose_.size(), kMostProblems); ++i) {
            loose.append(sessionJson(*loose_[i]));
        }
    }

    void addProblems(Json::Value &document) {
        for (Peer &peer : peers_) {
            std::move(peer.problems.begin(), peer.problems.end(), std::back_inserter(problems_));
        }
        std::stable_sort(
            problems_.begin(), problems_.end(),
            [](const Problem &left, const Problem &right) { return left.rank < right.rank; });
        Json::Value &list = document["problems"] = Json::Value(Json::arrayValue);
        for (std::size_t i = 0; i < std::min(problems_.size(), kMostProblems); ++i) {
            const Problem &problem = problems_[i];
            Json::Value json(Json::objectValue);
            json["kind"] = problem.kind;
            json["exit"] = problem.exit;
            json["message"] = problem.message;
            json["hint"] = problem.hint;
            const std::pair<const char *, const std::string &> others[] = {
                {"command", problem.command},
                {"node_id", problem.nodeId},
                {"cred_id", problem.credId}};
            for (const auto &[name, value] : others) {
                if (!value.empty()) {
                    json[name] = value;
                }
            }
            list.append(std::move(json));
        }
        document["problem_count"] = Json::UInt64{problems_.size()};
    }

    const OverviewRequest &request_;
    const OvraDRCore::CacheSnapshotScope snapshot_;
    const std::int64_t now_ = std::time(nullptr);
    std::string localId_;
    NodeName localName_;
    std::vector<SessionRecord> sessions_;
    std::vector<const SessionRecord *> loose_; ///< tied to no node
    std::vector<Peer> peers_;
    std::map<std::string, OvraPlatform::TrustStore::Entry> keys_;
    std::vector<Problem> problems_;
};

} // namespace

Json::Value makeOverview(const OverviewRequest &request) {
    return Maker(request).make();
}

std::string shellWord(const std::string &word) {
    constexpr char kPlain[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789"
                              "-_./:@%,+=";
    if (!word.empty() && word.find_first_not_of(kPlain) == std::string::npos) {
        return word;
    }
    std::string quoted = "'";
    for (const char c : word) {
        quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
    }
    return quoted + "'";
}

} // namespace OvraApps
