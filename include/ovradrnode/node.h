// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/export.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/response.h>

#include <functional>
#include <string>

namespace OvraDRNode {

/// Measures how fast data moves between nodes.
class OVRADRNODE_EXPORT Node : public OvraDRCore::ErrRecorder {
public:
    Node() = default;
    ~Node() override;

    /// The download speed of `url`, as printed by the measuring script; "" on failure (401 the
    /// script could not be run, 407 it printed nothing).
    /// \param timeout  seconds
    [[nodiscard]] std::string TestDownloadSpeed(const std::string &url, int retries, int timeout);
    /// The speed at which the remote node downloads from this one, over the first local endpoint
    /// that works, as the remote prints it; "" on failure (401, 407).
    /// \param timeout  seconds
    [[nodiscard]] std::string TestSyncSpeed(const std::string &nodeId, int retries, int timeout);

    /// Called for each endpoint, before (`answer` null) and after the attempt.
    /// \param sender  holds the reason if there is no valid answer
    using EndpointWatcher = std::function<void(const Conn &conn, const OvraDRCore::Response *answer,
                                               const OvraDRCore::ErrRecorder &sender)>;
    /// The same test, reporting progress to `watcher`.
    [[nodiscard]] std::string TestSyncSpeed(const std::string &nodeId, int retries, int timeout,
                                            const EndpointWatcher &watcher);
};

} // namespace OvraDRNode
