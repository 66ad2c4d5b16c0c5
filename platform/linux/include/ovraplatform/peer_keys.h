// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"

#include <json/value.h>

#include <string>
#include <vector>

namespace OvraPlatform {

/// While it lives, this thread carries out a call of a peer, and believes what the peer says about
/// its own keys: whoever has us log in to an endpoint of its own with a session of its own names
/// beside them, over the connection on which we know each other, the keys that the endpoint shows.
/// So the way back needs no question. That counts for the endpoint of this call alone, and only
/// while nothing is known of it: what is pinned, vouched for or withdrawn stays. Scopes nest;
/// destroy each in the thread that created it.
class OVRAPLATFORM_EXPORT PeerKeyScope {
public:
    /// \param params  of the call: "conn" with "addr", "protocol" and "port", and "_keys", an array
    ///                of fingerprints; anything else names nothing
    explicit PeerKeyScope(const Json::Value &params);
    PeerKeyScope(const PeerKeyScope &) = delete;
    PeerKeyScope &operator=(const PeerKeyScope &) = delete;
    ~PeerKeyScope();

    /// \param endpoint  as its key is stored
    bool names(const std::string &endpoint, const std::string &fingerprint) const;

private:
    std::string endpoint_;
    std::vector<std::string> keys_;
    const PeerKeyScope *previous_;
};

} // namespace OvraPlatform
