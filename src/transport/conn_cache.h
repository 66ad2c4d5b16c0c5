// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"

#include <ovradrcore/cache.h>

#include <json/value.h>

namespace OvraDRNode {

/// The verdict whether an endpoint answers: a JSON bool with a lifetime of 5 seconds.
class ConnCache : public OvraDRCore::Cache {
public:
    ~ConnCache() override;
    Json::Value GetInfo() const override;
    /// Probes.
    bool GetUpdatedData(Json::Value &value) const override;
    bool IsValid(const Json::Value &value) const override;
    /// The stored verdict: nobody waits for the probe of an endpoint that was already dead.
    bool IsUpdatedDataRequired() const override;

    explicit ConnCache(const Conn &conn);

    /// The stored verdict, however old; true if there is none.
    bool getStoredVerdict() const;
    /// Whether the stored verdict is fresh and says that the endpoint does not answer.
    bool isHeldUnreachable() const;
    /// Logs a changed verdict under the name `function`.
    void logChange(const char *function, bool oldVerdict, bool newVerdict) const;

private:
    Conn conn;
};

/// The result of a probe.
struct ProbeResult {
    bool connectable = false;
    /// False: the probe could not be set up, which says nothing about the endpoint.
    bool ran = true;
    /// True: this process had no memory, descriptor, thread or local port left, which says nothing
    /// either.
    bool lacked = false;
};

/// Probes the web-API entry point of the endpoint for any answer; sends no secret; waits 10 seconds
/// at most.
ProbeResult IsConnectableWithErrCheck(const Conn &conn);

} // namespace OvraDRNode
