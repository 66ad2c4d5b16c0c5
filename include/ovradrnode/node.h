// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/err_recorder.h"
#include "ovradrnode/export.h"

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
    std::string TestDownloadSpeed(const std::string &url, int retries, int timeout);
    /// How fast the remote node downloads from this one, over the first local endpoint at which
    /// that works, as the remote words it; "" on failure (401, 407). \param timeout  seconds
    std::string TestSyncSpeed(const std::string &nodeId, int retries, int timeout);
};

} // namespace OvraDRNode
