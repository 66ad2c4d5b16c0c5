// SPDX-License-Identifier: Apache-2.0
#include "handlers/handlers.h"
#include "handlers/params.h"
#include "handlers/words.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrnode/node.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/farlink.h>

#include <algorithm>
#include <string>

namespace Ovradrd {

namespace {

namespace ERR = OvraDRCore::ERR;
using OvraDRNode::Conn;
using OvraPlatform::APICaller;
using OvraPlatform::apiError;

constexpr std::size_t kMaxUrl = 2048;
constexpr int kMaxRetries = 10;
/// Callers wait 60 seconds for the answer.
constexpr int kMaxSeconds = 45;
constexpr int kUsualSeconds = 15;
constexpr char kSchemeEnd[] = "://";

struct Bounds {
    int retries = 0;
    int seconds = 0;
};

/// Excess values are clamped, because callers do not know the bounds.
Bounds boundsIn(Params &in) {
    Bounds bounds;
    bounds.retries = std::min(in.number("retries"), kMaxRetries);
    bounds.seconds = std::min(in.number("timeout"), kMaxSeconds);
    bounds.seconds = bounds.seconds == 0 ? kUsualSeconds : bounds.seconds;
    return bounds;
}

/// The URL for a download: a relay alias is replaced by its current address, and a bare IPv6
/// address gets brackets. "" if it is not a test URL.
std::string downloadableUrl(const std::string &url) {
    const std::size_t host = url.find(kSchemeEnd);
    const std::size_t path = host == std::string::npos ? host : url.find('/', host + 3);
    const std::size_t colon = path == std::string::npos ? path : url.rfind(':', path);
    if (colon == std::string::npos || colon <= host + 3) {
        return {};
    }
    Conn conn(url.substr(host + 3, colon - host - 3), url.substr(0, host), 0);
    std::string port = url.substr(colon + 1, path - colon - 1);
    if (conn.isFarlink()) {
        const auto settings =
            OvraPlatform::readFarlinkSettings().value_or(OvraPlatform::FarlinkSettings());
        const auto place = OvraPlatform::FarlinkClient(settings).lookUp(conn.addr);
        conn = place ? Conn::https(place->host, place->port) : Conn();
        port = std::to_string(conn.port);
    }
    if (conn.protocol != "http" && conn.protocol != "https") {
        return {};
    }
    const bool bare = conn.addr.find(':') != std::string::npos && conn.addr.front() != '[';
    return conn.protocol + kSchemeEnd + (bare ? "[" + conn.addr + "]" : conn.addr) + ":" + port +
           url.substr(path);
}

Json::Value speedReply(const OvraDRNode::Node &test, const std::string &speed, const char *why) {
    if (test.GetErrCode() != ERR::kNone || speed.empty()) {
        return apiError(test.GetErrCode() != ERR::kNone ? test.GetErrCode() : int{ERR::kFailed},
                        why);
    }
    Json::Value data(Json::objectValue);
    data["speed"] = speed;
    return OvraPlatform::apiSuccess(data);
}

/// How fast this node downloads from another one.
Json::Value testDownloadSpeed(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const std::string url = in.text("url", kMaxUrl);
    const Bounds bounds = boundsIn(in);
    const std::string direct = in.ok() ? downloadableUrl(url) : std::string();
    if (in.ok() && direct.empty()) {
        in.refuse("url", "url has to be http://, https:// or flk:// with host, port and path, and "
                         "an alias has to be known to the relay service");
    }
    if (!in.ok()) {
        return in.error();
    }
    OvraDRNode::Node test;
    const std::string speed = test.TestDownloadSpeed(direct, bounds.retries, bounds.seconds);
    return speedReply(
        test, speed,
        "the file cannot be downloaded by this node: check the way between the nodes, "
        "and that the test scripts are installed");
}

/// How fast another node downloads from this one.
Json::Value testSyncSpeed(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const std::string nodeId = in.text("node_id", Params::kMaxId);
    const Bounds bounds = boundsIn(in);
    if (!in.ok()) {
        return in.error();
    }
    OvraDRNode::Node test;
    const std::string speed = test.TestSyncSpeed(nodeId, bounds.retries, bounds.seconds);
    return speedReply(test, speed,
                      "the other node downloads from none of the endpoints of this one: check the "
                      "node id and the way between the nodes");
}

} // namespace

void addSpeedAPI(OvraPlatform::APIRegistry &registry) {
    using OvraPlatform::APIQueue;
    using OvraPlatform::APIRight;
    registry.add(kNodeApi, 1, "test_download_speed", APIRight::kPairing, APIQueue::kOutbound,
                 testDownloadSpeed);
    registry.add(kNodeApi, 1, "test_sync_speed", APIRight::kPairing, APIQueue::kTwoWay,
                 testSyncSpeed);
}

} // namespace Ovradrd
