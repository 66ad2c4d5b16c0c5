// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/endpoint.h"
#include "ovraplatform/peer_keys.h"

#include <json/value.h>

#include <string>

namespace OvraPlatform {

/// Adds the keys of this appliance to the parameters of a call that names an endpoint for the way
/// back to it ("conn" beside "session"); others stay as they are.
void nameOwnKeys(Json::Value &params);

/// Whether the peer whose call this thread carries out named that key as its own at that endpoint.
bool isNamedByPeer(const Endpoint &endpoint, const std::string &fingerprint);

} // namespace OvraPlatform
