// SPDX-License-Identifier: Apache-2.0
#include "handlers/handlers.h"

#include <ovraplatform/api_errors.h>

namespace Ovradrd {

using OvraPlatform::APICaller;

void addEncryptionAPI(OvraPlatform::APIRegistry &registry, const OvraPlatform::SealKeyPair &keys,
                      OvraPlatform::ReplayGuard &guard) {
    registry.add("OVRA.Core.Encryption", 1, "getinfo", OvraPlatform::APIRight::kNone,
                 OvraPlatform::APIQueue::kQuick,
                 [&keys, &guard](const Json::Value & /*params*/, const APICaller & /*caller*/) {
                     Json::Value data(Json::objectValue);
                     data["public_key"] = OvraPlatform::publicKeyText(keys.publicKey());
                     data["time"] = Json::Int64{guard.now()};
                     return OvraPlatform::apiSuccess(data);
                 });
}

} // namespace Ovradrd
