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

    /// How fast `url` downloads to this node, as the measuring script words it; "" on failure (401
    /// the script could not be run, 407 it printed nothing).
    /// \param timeout  seconds
    [[nodiscard]] std::string TestDownloadSpeed(const std::string &url, int retries, int timeout);
    /// How fast the remote node downloads from this one, over the first local endpoint at which
    /// that works, as the remote words it; "" on failure (401, 407). \param timeout  seconds
    [[nodiscard]] std::string TestSyncSpeed(const std::string &nodeId, int retries, int timeout);

    /// Is told of each endpoint that is tried: before (`answer` null) and after. \param sender  why
    /// there is no valid answer
    using EndpointWatcher = std::function<void(const Conn &conn, const OvraDRCore::Response *answer,
                                               const OvraDRCore::ErrRecorder &sender)>;
    /// The same test for somebody who watches it.
    [[nodiscard]] std::string TestSyncSpeed(const std::string &nodeId, int retries, int timeout,
                                            const EndpointWatcher &watcher);
};

} // namespace OvraDRNode
