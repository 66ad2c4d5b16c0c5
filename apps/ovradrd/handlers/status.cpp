// SPDX-License-Identifier: Apache-2.0
#include "handlers/handlers.h"
#include "handlers/params.h"
#include "service/certificate.h"
#include "version.h"

#include <ovraplatform/api_errors.h>
#include <ovraplatform/appliance.h>

#include <ctime>

namespace Ovradrd {

namespace {

using OvraApps::OverviewRequest;
using OvraPlatform::APICaller;

/// Everything that is known here, without asking anybody; who asks for it has the peers watched.
Json::Value overview(const StatusSources &sources, const OvraPlatform::SealKeyPair &keys,
                     std::int64_t since, const Json::Value &params) {
    Params in(params);
    OverviewRequest request;
    if (in.has("offset")) {
        request.offset = static_cast<std::size_t>(in.number("offset"));
    }
    if (in.has("limit")) {
        request.limit = static_cast<std::size_t>(in.number("limit"));
        if (in.ok() && request.limit > OverviewRequest::kMaxPeers) {
            in.refuse("limit", "has to be " + std::to_string(OverviewRequest::kMaxPeers) +
                                   " at most: ask for the others with offset");
        }
    }
    if (!in.ok()) {
        return in.error();
    }
    sources.watch.wake();
    const OvraApps::DaemonFacts facts{since, sources.watch.facts(), sources.uses.list()};
    request.httpsKey = OvraService::certificateFingerprint(OvraPlatform::kTlsCertificateFile);
    request.httpKey = OvraPlatform::fingerprintOf(keys.publicKey());
    request.version = kVersion;
    request.daemon = &facts;
    return OvraPlatform::apiSuccess(OvraApps::makeOverview(request));
}

} // namespace

void addStatusAPI(OvraPlatform::APIRegistry &registry, const OvraPlatform::SealKeyPair &keys,
                  StatusSources sources) {
    registry.add("OVRA.DR.Status", 1, "overview", OvraPlatform::APIRight::kAdministrator,
                 OvraPlatform::APIQueue::kQuick,
                 [&keys, sources, since = std::time(nullptr)](const Json::Value &params,
                                                              const APICaller & /*caller*/) {
                     return overview(sources, keys, since, params);
                 });
}

} // namespace Ovradrd
