// SPDX-License-Identifier: Apache-2.0
#include "webapi/local_wire.h"

#include <ovradrcore/json.h>

#include <arpa/inet.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <utility>

namespace OvraPlatform {

namespace {

int millisecondsUntil(Deadline deadline) {
    using std::chrono::milliseconds;
    const auto left =
        std::chrono::ceil<milliseconds>(deadline - std::chrono::steady_clock::now()).count();
    constexpr std::int64_t kMaxMilliseconds = std::int64_t{24} * 60 * 60 * 1000;
    return static_cast<int>(std::clamp<std::int64_t>(left, 0, kMaxMilliseconds));
}

/// Waits until `fd` is ready for `events`; false if the time is over or `stop` is readable.
bool waitFor(int fd, short events, Deadline deadline, int stop) {
    std::array<pollfd, 2> fds{{{fd, events, 0}, {stop, POLLIN, 0}}};
    for (;;) {
        const int left = millisecondsUntil(deadline);
        const int ready = poll(fds.data(), fds.size(), left);
        if (ready < 0 && errno != EINTR) {
            return false;
        }
        if (ready > 0) {
            return fds[1].revents == 0;
        }
        if (left == 0) {
            return false;
        }
    }
}

/// Moves all of `size` bytes with `step` (send or recv of a part), waiting while the socket is not
/// ready.
template <typename Step>
bool transfer(int fd, short events, std::size_t size, Deadline deadline, int stop, Step step) {
    for (std::size_t done = 0; done < size;) {
        const ssize_t moved = step(done);
        if (moved > 0) {
            done += static_cast<std::size_t>(moved);
            continue;
        }
        const bool notReady = moved < 0 && errno == EAGAIN;
        const bool interrupted = moved < 0 && errno == EINTR;
        if (!interrupted && !(notReady && waitFor(fd, events, deadline, stop))) {
            return false;
        }
    }
    return true;
}

bool receiveAll(int fd, char *data, std::size_t size, Deadline deadline, int stop) {
    return transfer(fd, POLLIN, size, deadline, stop,
                    [&](std::size_t done) { return recv(fd, data + done, size - done, 0); });
}

} // namespace

bool sendFrame(int fd, const std::string &text, Deadline deadline, int stop) {
    if (text.size() > kMaxFrame) {
        return false;
    }
    const std::uint32_t length = htonl(static_cast<std::uint32_t>(text.size()));
    std::string frame(reinterpret_cast<const char *>(&length), sizeof(length));
    frame += text;
    return transfer(fd, POLLOUT, frame.size(), deadline, stop, [&](std::size_t done) {
        return send(fd, frame.data() + done, frame.size() - done, MSG_NOSIGNAL);
    });
}

std::optional<std::string> receiveFrame(int fd, Deadline deadline, int stop) {
    std::array<char, sizeof(std::uint32_t)> head{};
    if (!receiveAll(fd, head.data(), head.size(), deadline, stop)) {
        return std::nullopt;
    }
    std::uint32_t length = 0;
    std::memcpy(&length, head.data(), sizeof(length));
    length = ntohl(length);
    if (length > kMaxFrame) {
        return std::nullopt;
    }
    std::string text(length, '\0');
    if (!receiveAll(fd, text.data(), text.size(), deadline, stop)) {
        return std::nullopt;
    }
    return text;
}

bool isPeerTrusted(int fd) {
    ucred peer{};
    socklen_t size = sizeof(peer);
    if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) {
        return false;
    }
    return peer.uid == 0 || peer.uid == geteuid();
}

std::string toLocalRequest(const LocalCall &call) {
    Json::Value request(Json::objectValue);
    request["api"] = call.api;
    request["version"] = call.version;
    request["method"] = call.method;
    request["params"] = call.params;
    request["user"] = call.user;
    return OvraDRCore::toString(request);
}

std::optional<LocalCall> parseLocalRequest(const std::string &text) {
    Json::Value parsed;
    if (!OvraDRCore::fromString(parsed, text) || !parsed.isObject()) {
        return std::nullopt;
    }
    const Json::Value &request = parsed;
    const Json::Value &params = request["params"];
    LocalCall call;
    call.api = OvraDRCore::memberString(request, "api");
    call.method = OvraDRCore::memberString(request, "method");
    call.user = OvraDRCore::memberString(request, "user");
    if (call.api.empty() || call.method.empty() || call.user.empty() ||
        !request["version"].isInt() || !(params.isNull() || params.isObject())) {
        return std::nullopt;
    }
    call.version = request["version"].asInt();
    if (!params.isNull()) {
        call.params = std::move(parsed["params"]);
    }
    return call;
}

} // namespace OvraPlatform
