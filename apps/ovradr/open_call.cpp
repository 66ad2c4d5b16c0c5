// SPDX-License-Identifier: Apache-2.0
#include "open_call.h"

#include "endpoint.h"
#include "shared/overview.h"
#include "target.h"
#include "trust.h"

#include <ovracredential/cred_request.h>

#include <chrono>
#include <cmath>
#include <cstdio>
#include <memory>

namespace Ovradr {

using OvraDRCore::Response;
using OvraDRNode::Conn;

namespace {

constexpr long kSeconds = 10;
constexpr int kSealed = 2;

double wallClock() {
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch())
        .count();
}

} // namespace

Expected<Response> callOpen(const Conn &conn, const OpenCall &call) {
    OVRA::CredRequest request;
    const std::unique_ptr<OVRACred, decltype(&OVRACredFree)> cred(OVRACredAlloc(), &OVRACredFree);
    const bool ready =
        cred && OVRACredItemSetProtocol(cred.get(), conn.protocol.c_str()) == 0 &&
        OVRACredItemSetHost(cred.get(), conn.addr.c_str()) == 0 &&
        OVRACredItemSetPort(cred.get(), conn.port) == 0 &&
        OVRA::CredRequest::CreateWebAPIRequest(request, cred.get(), nullptr, call.api, call.version,
                                               call.method, call.params) != 0 &&
        request.SetResponseTimeout(kSeconds) != 0 &&
        (!call.secret || request.SetEncryptMode(kSealed) != 0);
    if (!ready || request.Process(true, 0) == 0) {
        return endpointFailure(conn, static_cast<OvraPlatform::CredError>(request.GetError()));
    }
    Response response;
    response.setResp(request.GetResponse());
    return response;
}

Expected<double> clockAhead(const Conn &conn) {
    const double start = wallClock();
    const Expected<Response> answer = callOpen(conn, {"OVRA.Core.Encryption", 1, "getinfo", {}});
    if (!answer) {
        return Refusal(answer.error());
    }
    const double middle = (start + wallClock()) / 2;
    const Json::Value time = answer->getDataField("time");
    if (!time.isInt64()) {
        return failure(ExitCode::kNoAppliance, targetText(conn) + " does not tell its time.",
                       "Check that both appliances run versions that fit together.");
    }
    return static_cast<double>(time.asInt64()) / 1000 - middle;
}

std::string clockText(double ahead) {
    char text[64];
    std::snprintf(text, sizeof text, "%.1f s %s this one", std::abs(ahead),
                  ahead < 0 ? "behind" : "ahead of");
    return text;
}

Refusal withClock(Refusal failed, const Conn &conn) {
    if (failed.value().code != OvraDRCore::ERR::kLoginOtpWrong) {
        return failed;
    }
    const Expected<double> ahead =
        directEndpoint(conn).and_then([](const Conn &direct) { return clockAhead(direct); });
    if (ahead) {
        failed.value().hint =
            "Use the present code, each only once. Its clock is " + clockText(*ahead) +
            (std::abs(*ahead) <= OvraApps::kMaxClockSeconds ? ", which is near enough."
                                                            : ": set both by NTP.");
    }
    return failed;
}

} // namespace Ovradr
