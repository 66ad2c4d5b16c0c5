// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "farlink_agent.h"
#include "peer_watch.h"
#include "session_uses.h"

#include <ovraplatform/api_registry.h>
#include <ovraplatform/sealed_box.h>

/// The daemon's calls, one function per family. docs/ovradrd.md lists parameters, rights and
/// replies.
namespace Ovradrd {

/// "OVRA.Core.Encryption": the key that requests are sealed to. \param keys, guard  must outlive
/// the registry
void addEncryptionAPI(OvraPlatform::APIRegistry &registry, const OvraPlatform::SealKeyPair &keys,
                      OvraPlatform::ReplayGuard &guard);
/// "OVRA.Core.User": accounts of the appliance.
void addUserAPI(OvraPlatform::APIRegistry &registry);
/// "OVRA.Core.Farlink": how this appliance is reached through the relay service. \param agent  must
/// outlive the registry
void addFarlinkAPI(OvraPlatform::APIRegistry &registry, const FarlinkAgent &agent);
/// What only this process knows.
struct StatusSources {
    PeerWatch &watch;
    const SessionUses &uses;
};

/// "OVRA.DR.Status": everything that is known of this node and those around it. \param keys,
/// sources must outlive the registry
void addStatusAPI(OvraPlatform::APIRegistry &registry, const OvraPlatform::SealKeyPair &keys,
                  StatusSources sources);
/// "OVRA.DR.Node": facts about this node, and tests.
void addNodeAPI(OvraPlatform::APIRegistry &registry);
/// "OVRA.DR.Node": how fast data moves to this node, and from it to others.
void addSpeedAPI(OvraPlatform::APIRegistry &registry);
/// "OVRA.DR.Node.Session": sessions on this node, granted to other nodes.
void addNodeSessionAPI(OvraPlatform::APIRegistry &registry);
/// "OVRA.DR.Node.Credential": credentials that this node holds for reaching other nodes.
void addCredentialAPI(OvraPlatform::APIRegistry &registry);

} // namespace Ovradrd
