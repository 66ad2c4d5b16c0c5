// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "credential/sealed_box.h"
#include "support/misbehaving_server.h"

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <vector>

namespace OvraTest {

/// A remote node over HTTPS whose answers a test writes down, by session and call or by call alone.
/// A call without an answer of its own is a success without data. Sealed requests are opened and
/// their answers sealed; asking for the key to seal with does not count as a call, unless a test
/// answers it.
class RemoteNode {
public:
    RemoteNode();

    int port() const { return server.port(); }
    /// \param call      "method" or "session method"; "probe" for a bare request
    /// \param document  the reply
    void answer(const std::string &call, const std::string &document);
    /// Something else than a reply.
    void answer(const std::string &call, const Answer &answer);
    /// Runs before the calls of `method` are answered.
    void before(const std::string &method, std::function<void()> action);
    /// From now on connections are refused, and those that were kept are cut.
    void die();
    /// "session method" of each call so far, joined by ", ".
    std::string calls() const;
    void forgetCalls();
    /// The parameters of the last call of `method`, as JSON text; "" when there was none.
    std::string params(const std::string &method) const;

    MisbehavingServer server;

private:
    /// Either a reply document or bytes.
    struct Prepared {
        std::string document;
        Answer bytes;
        bool isDocument = true;
    };

    Answer respond(const Received &received);
    bool isPrepared(const std::string &call) const;
    Prepared prepared(const std::string &sid, const std::string &method) const;

    mutable std::mutex guard_;
    std::map<std::string, Prepared> answers_;
    std::map<std::string, std::function<void()>> actions_;
    std::vector<std::string> calls_;
    std::map<std::string, std::string> params_;
    OvraPlatform::SealKeyPair keys_;
    OvraPlatform::ReplayGuard replays_;
};

} // namespace OvraTest
