// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "prompt.h"

#include <ovradrnode/conn.h>
#include <ovradrnode/dr_node.h>

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace Ovradr {

/// The log-in tried by a diagnosis.
struct LoginTrial {
    std::string account;
    const Secret &password;
    std::string oneTimeCode;
};

/// What is known about an endpoint beforehand.
struct DiagnosisSubject {
    OvraDRNode::Conn conn;
    std::optional<OvraDRNode::DRNode> cred; ///< its session is used
    std::optional<LoginTrial> login;        ///< tried instead of a session
    std::string fingerprint;                ///< the required key, or ""
    bool own = false;                       ///< of this appliance: only the steps up to "answer"
    bool daemonRuns = false;                ///< of an own one: ovradrd answers on its socket
};

/// Examines things step by step. If a step fails, the steps that need it are skipped; the first
/// failure is the overall verdict.
class Diagnosis {
public:
    struct Step {
        enum class State { kOk, kFailed, kSkipped };
        std::string name;
        State state = State::kSkipped;
        double milliseconds = 0;
        std::string detail; ///< what was found, what was wrong, or why it was skipped
        std::string hint;   ///< what to do
    };
    /// What a step found, or why it failed.
    using Action = std::function<Expected<std::string>()>;

    /// \param subject  what is examined, for people
    explicit Diagnosis(std::string subject);

    /// Runs and times a step. \return whether it succeeded.
    bool run(const std::string &name, const Action &action);
    void skip(const std::string &name, const std::string &why);

    const std::string &subject() const { return subject_; }
    /// The first failure, if any step failed.
    const Expected<void> &verdict() const { return verdict_; }
    /// Members "subject" and "steps".
    Json::Value toJson() const;
    std::string toText() const;

private:
    std::string subject_;
    std::vector<Step> steps_;
    Expected<void> verdict_;
};

/// Examines an endpoint: the steps "resolve", "connect", "key", "answer", "session" or "log-in",
/// "identity", "right" and "clock". Nothing secret is sent before the key is trusted, and nothing
/// is trusted without being asked for. Takes at most 10 seconds per step, and 60 for a request.
void diagnoseEndpoint(const DiagnosisSubject &subject, Diagnosis &diagnosis);

/// Examines what this appliance itself needs: its files, settings, keys, caches and daemon.
/// \return whether the daemon answers on its socket
bool diagnoseAppliance(Diagnosis &diagnosis);

} // namespace Ovradr
