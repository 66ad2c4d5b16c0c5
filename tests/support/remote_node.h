// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "support/misbehaving_server.h"
#include "support/sealing_daemon.h"

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <vector>

namespace OvraTest {

/// A remote node over HTTPS with scripted answers, by session and call or by call alone. A call
/// without a scripted answer succeeds without data. Sealed requests are opened and their answers
/// sealed; a request for the sealing key does not count as a call, unless a test scripts its
/// answer.
class RemoteNode {
public:
    RemoteNode();

    int port() const { return server.port(); }
    /// Has this appliance know its key.
    void trust() const;
    /// \param call  "method" or "session method"; "probe" for a bare request
    void answer(const std::string &call, const SealingDaemon::Reply &reply);
    void forgetAnswers();
    /// Runs before the calls of `method` are answered.
    void before(const std::string &method, std::function<void()> action);
    /// From now on connections are refused, and idle ones are cut.
    void die();
    /// "session method" of each call so far, joined by ", ".
    std::string calls() const;
    /// How many of them are `call`.
    long count(const std::string &call) const;
    void forgetCalls();
    /// The parameters of the last call of `method`, as JSON text; "" if there was none.
    std::string params(const std::string &method) const;

    MisbehavingServer server;

private:
    Answer respond(const Received &received);
    SealingDaemon::Reply record(const std::string &call, const std::string &sid,
                                const std::string &method, const Json::Value &params);
    std::optional<SealingDaemon::Reply> prepared(const std::string &call) const;

    mutable std::mutex guard_;
    std::map<std::string, SealingDaemon::Reply> answers_;
    std::map<std::string, std::function<void()>> actions_;
    std::vector<std::string> calls_;
    std::map<std::string, std::string> params_;
    SealingDaemon daemon_;
};

} // namespace OvraTest
