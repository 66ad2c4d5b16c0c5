// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"

#include <ovradrcore/cache.h>

#include <json/value.h>

namespace OvraDRNode {

/// The verdict whether an endpoint answers: a JSON bool that lives 5 seconds.
class ConnCache : public OvraDRCore::Cache {
public:
    ~ConnCache() override;
    Json::Value GetInfo() const override;
    /// Probes.
    bool GetUpdatedData(Json::Value &value) const override;
    bool IsValid(const Json::Value &value) const override;
    /// The stored verdict: nobody waits for the probe of an endpoint that was dead already.
    bool IsUpdatedDataRequired() const override;

    explicit ConnCache(const Conn &conn);

    /// The stored verdict, however old; true when there is none.
    bool getStoredVerdict() const;
    /// Logs, as a line of `function`, a verdict that differs from the one before.
    void logChange(const char *function, bool oldVerdict, bool newVerdict) const;

private:
    Conn conn;
};

/// What a probe found out.
struct ProbeResult {
    bool connectable = false;
    /// False: the probe could not even be set up, which says nothing about the endpoint.
    bool ran = true;
};

/// Asks the web-API entry point of the endpoint for any answer; carries no secret; 10 seconds at
/// most.
ProbeResult IsConnectableWithErrCheck(const Conn &conn);

} // namespace OvraDRNode
