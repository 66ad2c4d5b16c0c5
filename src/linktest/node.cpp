// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node.h"

#include "ovradrnode/conn.h"
#include "ovradrnode/node_api.h"
#include "ovradrnode/node_db.h"
#include "ovradrnode/sender.h"
#include "paths.h"
#include "words.h"

#include <ovrabase/safe_path.h>
#include <ovracore/ovracore.h>
#include <ovradrcore/log.h>
#include <ovradrcore/response.h>
#include <ovradrcore/util.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <vector>

namespace OvraDRNode {

namespace ERR = OvraDRCore::ERR;
using OvraDRCore::Response;

namespace {

struct ClosePipe {
    void operator()(std::FILE *stream) const { OLIBCPclose(stream); }
};
using Pipe = std::unique_ptr<std::FILE, ClosePipe>;

/// The first line, unchanged: a newline that the script prints is part of the value.
std::string readFirstLine(std::FILE *stream) {
    char *line = nullptr;
    std::size_t size = 0;
    const bool read = getline(&line, &size, stream) != -1;
    const std::unique_ptr<char, decltype(&std::free)> owner(line, &std::free);
    return read ? line : "";
}

/// Runs a script, unless somebody else could have put it there: it runs with our rights.
template <typename... Arguments>
Pipe runScript(const char *script, Arguments... arguments) {
    if (const auto safe = OvraBase::checkPathToRun(script); !safe) {
        OVRA_ERR("[%s] is not run: %s", script, safe.error().text.c_str());
        return {};
    }
    return Pipe(OLIBCPopen(script, "r", arguments..., nullptr));
}

std::string TestSyncSpeedMakeTestFile() {
    const Pipe pipe = runScript(Path::kSyncSpeedScript, "setup");
    if (!pipe) {
        OVRA_ERR("Failed to execute command %s.", Path::kSyncSpeedScript);
        return {};
    }
    return readFirstLine(pipe.get());
}

std::string downloadUrl(const Conn &conn, const std::string &testFile) {
    return conn.protocol + "://" + conn.addr + ":" + OvraDRCore::ToString<int>(conn.port) +
           Path::kWebTestFiles + testFile;
}

} // namespace

Node::~Node() = default;

std::string Node::TestDownloadSpeed(const std::string &url, int retries, int timeout) {
    SetErr(ERR::kFailed);
    const Pipe pipe = runScript(Path::kDownloadSpeedScript, url.c_str(),
                                OvraDRCore::ToString<int>(retries).c_str(),
                                OvraDRCore::ToString<int>(timeout).c_str());
    if (!pipe) {
        OVRA_ERR("Failed to exec the command [%s].", Path::kDownloadSpeedScript);
        SetErr(ERR::kBadParameter);
        return {};
    }
    std::string speed = readFirstLine(pipe.get());
    if (!speed.empty()) {
        SetErr(ERR::kNone);
    }
    return speed;
}

std::string Node::TestSyncSpeed(const std::string &nodeId, int retries, int timeout) {
    return TestSyncSpeed(nodeId, retries, timeout,
                         [](const Conn &, const Response *, const OvraDRCore::ErrRecorder &) {});
}

std::string Node::TestSyncSpeed(const std::string &nodeId, int retries, int timeout,
                                const EndpointWatcher &watcher) {
    SetErr(ERR::kFailed);
    const std::string testFile = TestSyncSpeedMakeTestFile();
    if (testFile.empty()) {
        OVRA_ERR("Sync speed test file create failed.");
        SetErr(ERR::kBadParameter);
        return {};
    }
    DRNode node;
    if (!DRNodeDB::Get(nodeId, node)) {
        OVRA_ERR("Node [%s] not exists.", nodeId.c_str());
        return {}; // the file is removed later, with other old ones
    }
    Response response;
    for (const Conn &conn : Conn::listLocal()) {
        const std::string url = downloadUrl(conn, testFile);
        OVRA_INFO("Download url: %s", url.c_str());
        NodeSender sender(nodeId);
        watcher(conn, nullptr, sender);
        response = sender.process(WebAPI::getDRNodeTestDownloadSpeedAPI(url, retries, timeout));
        watcher(conn, &response, sender);
        if (response.isSuccess()) {
            break;
        }
    }
    if (response.isSuccess() && !response.getDataField(Word::kSpeed).isString()) {
        OVRA_ERR("Field 'speed' sould exist, being a string.");
        SetErr(ERR::kBadParameter);
    }
    std::string speed = response.getDataFieldtoStr(Word::kSpeed);
    if (std::remove(testFile.c_str()) != 0) {
        SetErr(ERR::kBadParameter);
    }
    if (!speed.empty()) {
        SetErr(ERR::kNone);
    }
    return speed;
}

} // namespace OvraDRNode
