// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "clock.h"
#include "support/local_node.h"
#include "support/log_capture.h"
#include "support/remote_node.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/json.h>
#include <ovradrnode/conn.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/api_registry.h>

#include <gtest/gtest.h>

#include <string>

namespace OvraTest {

/// 0 if an operation succeeded, else the code that its object recorded; -1 if it recorded none.
inline int codeOf(bool done, const OvraDRCore::ErrRecorder &object) {
    return done ? 0 : (object.GetErrCode() != 0 ? object.GetErrCode() : -1);
}

/// A provisioned local node, where the users joe and ann exist.
class LocalNode : public testing::Test {
protected:
    LocalNode() {
        provisionNode();
        OvraDRNode::DRNode::getLocalNodeId();
        host("OVRA.Core.User", "get", [](const Json::Value &params, const auto &) {
            const bool known = params["name"] == "joe" || params["name"] == "ann";
            return known ? OvraPlatform::apiSuccess() : OvraPlatform::apiError(1);
        });
    }
    ~LocalNode() override { OvraDRCore::setSystemClock(nullptr); }

    /// Answers a call of this appliance's administrator.
    void host(const std::string &api, const std::string &method, OvraPlatform::APIHandler handler) {
        registry_.add(api, 1, method, OvraPlatform::APIRight::kAdministrator,
                      OvraPlatform::APIQueue::kQuick, std::move(handler));
        registry_.host();
    }
    /// From now on the library's clock shows `now`, in milliseconds.
    static void stopClock() {
        OvraDRCore::setSystemClock([] { return now; });
    }

    static inline std::int64_t now = 1'000'000'000'000;
    /// A request that any session may make.
    const OvraDRCore::Request info = OvraDRNode::WebAPI::getDRNodeInfoAPI({});
    LogCapture log;

private:
    OvraPlatform::APIRegistry registry_;
};

/// A local node, and a remote one for which it has no credential.
class TwoNodes : public LocalNode {
protected:
    TwoNodes() {
        remote.trust();
        log.clear();
    }
    void addNodeCred(const std::string &credId, const std::string &session) {
        addCred("node_cred", "n1", credId, "https", remote.port(), session);
    }

    RemoteNode remote;
    OvraDRNode::Conn conn = OvraDRNode::Conn::https("127.0.0.1", remote.port());
};

} // namespace OvraTest
