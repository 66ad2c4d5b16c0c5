// SPDX-License-Identifier: Apache-2.0
#include "diagnosis.h"

#include "endpoint.h"
#include "node_ref.h"
#include "open_call.h"
#include "output.h"
#include "provision/data_files.h"
#include "provision/node_database.h"
#include "renewal.h"
#include "shared/overview.h"
#include "target.h"
#include "tcp_reach.h"
#include "trust.h"

#include <ovrabase/file.h>
#include <ovrabase/safe_path.h>
#include <ovracredential/cred_request.h>
#include <ovradrcore/cache_folder.h>
#include <ovradrcore/json.h>
#include <ovradrnode/cred_permission_cache.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/appliance.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <system_error>

namespace Ovradr {

namespace {

using OvraDRCore::Response;
using OvraDRNode::BaseSender;
using OvraDRNode::Conn;
using OvraPlatform::CredError;
using OvraPlatform::PeerIdentity;
using OvraPlatform::TrustVerdict;
namespace WebAPI = OvraDRNode::WebAPI;

const char *stateText(Diagnosis::Step::State state) {
    switch (state) {
    case Diagnosis::Step::State::kOk:
        return "ok";
    case Diagnosis::Step::State::kFailed:
        return "FAILED";
    default:
        return "-";
    }
}

const char *stateWord(Diagnosis::Step::State state) {
    switch (state) {
    case Diagnosis::Step::State::kOk:
        return "ok";
    case Diagnosis::Step::State::kFailed:
        return "failed";
    default:
        return "skipped";
    }
}

/// Whether nobody else can change what root runs or reads.
Expected<std::string> checkPaths() {
    std::vector<std::string> paths = {"/proc/self/exe", "/run/lock", OvraPlatform::kCacheDir};
    for (const char *folder : {OvraPlatform::kConfigDir, OvraPlatform::kStateDir, kScriptFolder}) {
        paths.emplace_back(folder);
        std::error_code error;
        for (const auto &entry : std::filesystem::directory_iterator(folder, error)) {
            paths.push_back(entry.path().string());
        }
    }
    for (const std::string &path : paths) {
        if (const auto safe = OvraBase::checkPathToRun(path); !safe) {
            return failure(ExitCode::kNotSetUp,
                           "Root relies on " + path + ", and " + safe.error().text + ".",
                           "Until then nothing here can be trusted.");
        }
    }
    return std::string("nobody else can change what root runs or reads");
}

/// What the daemon would refuse at its next start.
Expected<std::string> checkSettings() {
    const OvraPlatform::ApplianceConfig config = OvraPlatform::readApplianceConfig();
    std::string problem = config.problems.empty() ? "" : config.problems.front();
    if (problem.empty() && !config.servesAllAddresses && config.addresses.empty()) {
        problem = "it names no address to serve at";
    }
    if (!problem.empty()) {
        return failure(ExitCode::kNotSetUp,
                       std::string(OvraPlatform::kConfigFile) + ": " + problem + ".",
                       "ovradrd does not start with it: correct the file.");
    }
    return "https " + std::to_string(config.httpsPort) + ", http " +
           std::to_string(config.httpPort);
}

/// Whether the secret keys are there, and nobody else can read them.
Expected<std::string> checkKeys() {
    using OvraBase::Links;
    struct KeyFile {
        const char *path;
        Links links;
        bool needed;
    };
    for (const KeyFile &key : {KeyFile{OvraPlatform::kTlsKeyFile, Links::kFollow, true},
                               {OvraPlatform::kSealKeyFile, Links::kRefuse, true},
                               {OvraPlatform::kDeviceKeyFile, Links::kRefuse, false},
                               {OvraPlatform::kFarlinkKeyFile, Links::kRefuse, false}}) {
        const auto content = OvraBase::readPrivateFile(key.path, key.links);
        if (content || (content.error().number == ENOENT && !key.needed)) {
            continue;
        }
        const std::string path = key.path;
        const bool tls = path == OvraPlatform::kTlsKeyFile;
        return failure(ExitCode::kNotSetUp,
                       "The key " + path + " cannot be used: " + content.error().text + ".",
                       content.error().number == ENOENT
                           ? "Restore it from a backup, or have `ovradr setup` make a new one" +
                                 std::string(tls ? ", with ovradrd.crt moved away" : "") +
                                 ": the others have to trust it."
                           : "chmod 600 " + path + "; if others may have read it, move it" +
                                 std::string(tls ? " and ovradrd.crt" : "") +
                                 " away, run `ovradr setup` and start ovradrd again: the others "
                                 "have to trust the new one.");
    }
    return std::string("nobody else can read them");
}

/// Whether what is learnt about other nodes is kept.
Expected<std::string> checkCache() {
    const std::string folder = OvraPlatform::kCacheDir;
    std::string problem = OvraDRCore::prepareCacheFolder(folder);
    if (problem.empty()) {
        OvraDRNode::CredPermissionCache probe("doctor");
        if (probe.SetCacheData(true) && probe.Remove()) {
            return folder;
        }
        problem = "takes no entry: make room, or remove what is in it";
    }
    return failure(ExitCode::kNotSetUp, folder + " " + problem + ".",
                   "Without a cache every request asks again whether its endpoint answers.");
}

/// The same failure under another exit code.
Refusal withExit(const Failure &found, ExitCode exit) {
    return failure(exit, found.message, found.hint);
}

/// With one digit behind the point.
std::string decimal(double number) {
    std::array<char, 64> text{};
    std::snprintf(text.data(), text.size(), "%.1f", number);
    return text.data();
}

/// The steps that examine one endpoint; each uses what those before it have found.
class EndpointSteps {
public:
    EndpointSteps(const DiagnosisSubject &subject, Diagnosis &diagnosis)
        : subject_(subject)
        , diagnosis_(diagnosis) {}

    void run() {
        const bool reached = diagnosis_.run("resolve", [this] { return resolve(); }) &&
                             diagnosis_.run("connect", [this] { return connect(); }) &&
                             diagnosis_.run("key", [this] { return key(); }) &&
                             diagnosis_.run("answer", [this] { return answer(); });
        if (!reached || subject_.own) {
            return;
        }
        runSession();
        if (trusted_) {
            diagnosis_.run("clock", [this] { return clock(); });
        } else {
            diagnosis_.skip("clock", "its key is not trusted yet");
        }
    }

private:
    bool sendsSecrets() const { return subject_.cred || subject_.login; }

    void runSession() {
        if (!sendsSecrets()) {
            diagnosis_.skip("session", "no credential has this endpoint; --account tries a "
                                       "log-in");
            return;
        }
        const bool granted = subject_.login
                                 ? diagnosis_.run("log-in", [this] { return logIn(); })
                                 : diagnosis_.run("session", [this] { return session(); });
        if (!granted) {
            return;
        }
        if (info_.isSuccess()) {
            diagnosis_.run("identity", [this] { return identity(); });
        } else {
            diagnosis_.skip("identity", "it does not say who it is");
        }
        diagnosis_.run("right", [this] { return right(); });
    }

    Expected<std::string> resolve() {
        const Expected<Conn> direct = directEndpoint(subject_.conn);
        if (!direct) {
            return withExit(direct.error(), ExitCode::kNameUnknown);
        }
        conn_ = *direct;
        const Expected<Conn> place = placeOf(subject_.conn);
        if (!place) {
            return withExit(place.error(), ExitCode::kNameUnknown);
        }
        place_ = *place;
        const auto found = resolveHost(place_.addr, place_.port);
        if (!found) {
            return Refusal(found.error());
        }
        addresses_ = *found;
        std::string text = subject_.conn.isFarlink() ? targetText(place_) + ": " : "";
        for (const OvraBase::SocketAddress &address : addresses_) {
            text +=
                (&address == addresses_.data() ? "" : ", ") + OvraBase::addressText(address.get());
        }
        return text;
    }

    Expected<std::string> connect() const {
        auto connected = connectAny(addresses_, place_);
        if (!connected && connected.error().exit == ExitCode::kNotReachable && subject_.own &&
            !subject_.conn.isFarlink()) {
            connected.error().hint =
                subject_.daemonRuns
                    ? "ovradrd runs, but does not serve there: it reads the settings when it is "
                      "started. Start it again, or correct the settings."
                    : "Start ovradrd.";
        }
        return connected;
    }

    Expected<std::string> key() {
        const auto met =
            OvraPlatform::peerFingerprint(conn_.protocol, conn_.addr, conn_.port, kKeySeconds);
        for (const CredError told : {CredError::kTrustUnavailable, CredError::kOutOfMemory,
                                     CredError::kTimedOut, CredError::kTlsTooOld}) {
            if (met == tl::unexpected(told)) {
                return endpointFailure(conn_, told);
            }
        }
        if (!met) {
            return failure(ExitCode::kNoAppliance,
                           targetText(conn_) + ": what answers there shows no key.",
                           "Check protocol and port: HTTPS is 5001, HTTP 5000 as a rule.");
        }
        const PeerIdentity &peer = *met;
        if (subject_.own) {
            return expectedKey(peer);
        }
        trusted_ = peer.isTrusted() && subject_.fingerprint.empty();
        if (!trusted_ && peer.pinned == TrustVerdict::kLost && subject_.fingerprint.empty()) {
            return lostKey(peer);
        }
        if (trusted_ || (!sendsSecrets() && peer.pinned == TrustVerdict::kUnknown)) {
            return peer.fingerprint + "; trusted: " + trustText(peer);
        }
        if (const auto trusted = trustPeer(conn_, subject_.fingerprint); !trusted) {
            return Refusal(trusted.error());
        }
        trusted_ = true;
        return peer.fingerprint + "; trusted: yes, it is the known key";
    }

    Expected<std::string> lostKey(const PeerIdentity &peer) const {
        return failure(ExitCode::kCertificate,
                       "The key of " + targetText(conn_) + ", " + peer.fingerprint +
                           ", may have been lost: " + OvraPlatform::kKnownEndpointsFile +
                           " cannot be relied on, " + OvraPlatform::TrustStore().problem() + ".",
                       "Compare it with what `ovradr conn local` shows over there, then run "
                       "`ovradr conn trust " +
                           targetText(conn_) + "`.");
    }

    /// An endpoint of this appliance must show the key that is in its file.
    Expected<std::string> expectedKey(const PeerIdentity &peer) {
        if (peer.fingerprint != subject_.fingerprint) {
            return failure(ExitCode::kCertificate,
                           targetText(conn_) + " shows " + peer.fingerprint +
                               ", which is not the key that is expected.",
                           "ovradrd reads keys and settings when it is started: start it again "
                           "after a change; without one, something else answers there.");
        }
        return peer.fingerprint + ", as expected";
    }

    Expected<std::string> answer() const {
        return probeEndpoint(conn_)
            .map([] { return std::string("a web API"); })
            .or_else([](const Failure &found) -> Expected<std::string> {
                return withExit(found, ExitCode::kNoAppliance);
            });
    }

    Refusal senderFailure(const Response &response) const {
        Refusal found = failureOf(errorOf(*sender_, response));
        if (subject_.cred) {
            found = credFailure(found, subject_.cred->credId);
        }
        nameEndpoint(found.value(), conn_);
        return found;
    }

    Expected<std::string> logIn() {
        auto sender = std::make_unique<OvraDRNode::CredAccountSender>(
            conn_, subject_.login->account, subject_.login->password.get(),
            subject_.login->oneTimeCode);
        const bool loggedIn = sender->init();
        sender_ = std::move(sender);
        if (!loggedIn) {
            return senderFailure(Response());
        }
        info_ = sender_->process(WebAPI::getDRNodeInfoAPI({}));
        return "as " + subject_.login->account;
    }

    /// Any answer other than an unknown session shows that it is known.
    Expected<std::string> session() {
        sender_ = std::make_unique<OvraDRNode::CredNodeSender>(*subject_.cred);
        info_ = sender_->process(WebAPI::getDRNodeInfoAPI({}));
        if (!info_.isValid() || info_.getErrCode() == OvraPlatform::APIError::kNoSession) {
            return senderFailure(info_);
        }
        return std::string("the session of the credential is known");
    }

    Expected<std::string> identity() const {
        const std::string nodeId = info_.getDataFieldtoStr("node_id");
        const bool expected = subject_.cred ? nodeId == subject_.cred->nodeId : !nodeId.empty();
        if (!expected) {
            return failure(ExitCode::kWrongNode,
                           targetText(conn_) + " is the node \"" + nodeId + "\"" +
                               (subject_.cred ? ", not " + subject_.cred->nodeId : "") + ".",
                           "Its address went to another appliance, or its node id was reset: pair "
                           "with it again.");
        }
        return "node " + nodeId + ", " + info_.getDataFieldtoStr("hostname");
    }

    Expected<std::string> right() const {
        const Response response = sender_->process(WebAPI::getDRNodeTestPrivilegeAPI());
        if (response.isSuccess()) {
            return std::string("may operate on the node");
        }
        return senderFailure(response);
    }

    Expected<std::string> clock() const {
        return clockAhead(conn_).and_then([this](double ahead) { return judgeClock(ahead); });
    }

    Expected<std::string> judgeClock(double ahead) const {
        const std::string text = clockText(ahead);
        if (std::abs(ahead) > OvraApps::kMaxClockSeconds) {
            return failure(ExitCode::kClock,
                           "The clock of " + targetText(conn_) + " is " + text + ".",
                           "Set both by NTP: one-time codes need clocks that agree.");
        }
        return text;
    }

    const DiagnosisSubject &subject_;
    Diagnosis &diagnosis_;
    Conn conn_;  ///< the endpoint as senders use it
    Conn place_; ///< where it is reached
    std::vector<OvraBase::SocketAddress> addresses_;
    bool trusted_ = false;
    std::unique_ptr<BaseSender> sender_;
    Response info_;
};

} // namespace

Diagnosis::Diagnosis(std::string subject)
    : subject_(std::move(subject)) {}

bool Diagnosis::run(const std::string &name, const Action &action) {
    const auto start = std::chrono::steady_clock::now();
    const Expected<std::string> found = action();
    Step step;
    step.name = name;
    step.milliseconds =
        std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start).count();
    step.state = found ? Step::State::kOk : Step::State::kFailed;
    step.detail = found ? *found : found.error().message;
    step.hint = found ? "" : found.error().hint;
    steps_.push_back(step);
    if (!found && verdict_) {
        verdict_ = Refusal(found.error());
    }
    return static_cast<bool>(found);
}

void Diagnosis::skip(const std::string &name, const std::string &why) {
    Step step;
    step.name = name;
    step.detail = why;
    steps_.push_back(step);
}

Json::Value Diagnosis::toJson() const {
    Json::Value json;
    json["subject"] = subject_;
    json["steps"] = Json::Value(Json::arrayValue);
    for (const Step &step : steps_) {
        Json::Value entry;
        entry["step"] = step.name;
        entry["state"] = stateWord(step.state);
        entry["milliseconds"] = tenths(step.milliseconds);
        entry["detail"] = step.detail;
        entry["hint"] = step.hint;
        json["steps"].append(entry);
    }
    return json;
}

std::string Diagnosis::toText() const {
    std::vector<std::vector<std::string>> rows;
    for (const Step &step : steps_) {
        const bool skipped = step.state == Step::State::kSkipped;
        rows.push_back({step.name, stateText(step.state),
                        skipped ? "" : decimal(step.milliseconds) + " ms", step.detail});
        if (!step.hint.empty()) {
            rows.push_back({"", "", "", step.hint});
        }
    }
    return printable(subject_) + "\n" + table({"STEP", "", "TIME", "FOUND"}, rows);
}

void diagnoseEndpoint(const DiagnosisSubject &subject, Diagnosis &diagnosis) {
    EndpointSteps(subject, diagnosis).run();
}

bool diagnoseAppliance(Diagnosis &diagnosis) {
    std::string nodeId;
    diagnosis.run("files", [&nodeId]() -> Expected<std::string> {
        const Expected<std::string> id = localNode();
        if (!id) {
            return Refusal(id.error());
        }
        if (const auto usable = checkNodeDatabase(); !usable) {
            return Refusal(usable.error());
        }
        nodeId = *id;
        return "node " + nodeId;
    });
    diagnosis.run("settings", checkSettings);
    diagnosis.run("folders", checkPaths);
    diagnosis.run("keys", checkKeys);
    diagnosis.run("cache", checkCache);
    diagnosis.run("trusted keys", []() -> Expected<std::string> {
        const std::string problem = OvraPlatform::TrustStore().problem();
        if (!problem.empty()) {
            return failure(ExitCode::kNotSetUp,
                           std::string(OvraPlatform::kKnownEndpointsFile) +
                               " cannot be relied on: " + problem + ".",
                           "Endpoints that it does not name are refused: restore it from a backup, "
                           "or correct it and run `ovradr conn trust` for each.");
        }
        return std::string(OvraPlatform::kKnownEndpointsFile);
    });
    bool daemonRuns = false;
    diagnosis.run("daemon", [&nodeId, &daemonRuns]() -> Expected<std::string> {
        const Response info = BaseSender::run(WebAPI::getDRNodeInfoAPI({}));
        if (!info.isSuccess()) {
            return failure(ExitCode::kNotReachable, "The daemon of this appliance does not answer.",
                           "Start ovradrd, and read what it says in the system log.");
        }
        daemonRuns = true;
        if (!nodeId.empty() && info.getDataFieldtoStr("node_id") != nodeId) {
            return failure(ExitCode::kWrongNode,
                           "The daemon still answers as the node " +
                               info.getDataFieldtoStr("node_id") + ".",
                           "The node id was changed while it ran: start ovradrd again.");
        }
        return "answers as " + info.getDataFieldtoStr("hostname");
    });
    return daemonRuns;
}

} // namespace Ovradr
