// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/local_server.h"

#include "ovraplatform/api_errors.h"
#include "ovraplatform/appliance.h"
#include "webapi/local_address.h"
#include "webapi/local_wire.h"

#include <ovrabase/file.h>
#include <ovrabase/secret.h>
#include <ovrabase/unique_fd.h>
#include <ovradrcore/file_lock.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <exception>
#include <optional>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

namespace OvraPlatform {

namespace {

using OvraBase::UniqueFd;
/// Success, or why it cannot start.
using Started = tl::expected<void, std::string>;

constexpr std::chrono::seconds kReadTime{10};
constexpr std::chrono::seconds kWriteTime{10};
constexpr std::chrono::milliseconds kPauseWithoutDescriptors{50};
constexpr int kQueue = 128;

/// Removes a socket file that is no longer served.
/// \return why not: the path is taken by something else.
Started clearPlace(const std::string &path, const sockaddr_un &address) {
    struct stat status {};
    if (lstat(path.c_str(), &status) != 0) {
        return {};
    }
    if (!S_ISSOCK(status.st_mode)) {
        return tl::unexpected(path + " is not a socket: move it away");
    }
    const UniqueFd probe(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    const bool answered = probe && (connectLocal(probe.get(), address) || errno != ECONNREFUSED);
    if (answered) {
        return tl::unexpected("another process already answers on " + path + ": stop it first");
    }
    if (unlink(path.c_str()) != 0) {
        return tl::unexpected("cannot remove the old socket " + path + ": " +
                              OvraBase::errnoText(errno));
    }
    return {};
}

std::string stopsReply() {
    return OvraDRCore::toString(apiError(APIError::kTooBusy, "the daemon stops: try again later"));
}

} // namespace

struct LocalServer::Impl {
    Impl(std::string socketPath, LocalHandler callHandler, unsigned int count)
        : path(std::move(socketPath))
        , handler(std::move(callHandler))
        , threadCount(count)
        , lock(path + ".lock") {}

    Started takePlace();
    void serveConnections();
    void serve(int peer);
    void refuseRest() const;
    bool isStopping() const;
    Json::Value answer(const std::string &request);

    const std::string path;
    const LocalHandler handler;
    const unsigned int threadCount;
    OvraDRCore::FileLock lock;
    UniqueFd listener;
    UniqueFd stopEvent;
    std::vector<std::thread> threads;
};

Started LocalServer::Impl::takePlace() {
    const std::optional<sockaddr_un> address = localAddress(path);
    if (!address) {
        return tl::unexpected("the path " + path +
                              " is too long for a socket: use a shorter folder");
    }
    if (!ensureStateDir(OvraBase::folderOf(path))) {
        return tl::unexpected("the folder of " + path + " cannot be used: the log says why");
    }
    // Held as long as the server lives, so that two that start at once cannot take the place of
    // each other.
    if (!lock.lock(LOCK_EX | LOCK_NB, 0)) {
        return tl::unexpected("another process holds " + path +
                              ".lock: stop the daemon that runs already");
    }
    if (Started cleared = clearPlace(path, *address); !cleared) {
        return cleared;
    }
    UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    // The mode that the file gets from bind(2) is the socket's own, so that it is never open wider.
    // After it, because the umask may have taken rights of our own; the folder is ours alone.
    if (!fd || fchmod(fd.get(), 0600) != 0 || !bindLocal(fd.get(), *address) ||
        chmod(path.c_str(), 0600) != 0 || listen(fd.get(), kQueue) != 0) {
        return tl::unexpected("cannot listen on " + path + ": " + OvraBase::errnoText(errno));
    }
    listener = std::move(fd);
    return {};
}

void LocalServer::Impl::serveConnections() {
    for (;;) {
        std::array<pollfd, 2> fds{{{listener.get(), POLLIN, 0}, {stopEvent.get(), POLLIN, 0}}};
        if (poll(fds.data(), fds.size(), -1) < 0) {
            continue; // EINTR
        }
        if (fds[1].revents != 0) {
            return;
        }
        const UniqueFd peer(
            accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
        if (peer) {
            serve(peer.get());
            OvraBase::wipeStack(); // of the passwords and codes in the call
        } else if (errno == EMFILE || errno == ENFILE || errno == ENOMEM || errno == ENOBUFS) {
            std::this_thread::sleep_for(kPauseWithoutDescriptors);
        }
    }
}

void LocalServer::Impl::serve(int peer) {
    try {
        const auto now = std::chrono::steady_clock::now();
        std::string reply;
        if (isPeerTrusted(peer)) {
            const std::optional<std::string> request =
                receiveFrame(peer, now + kReadTime, stopEvent.get());
            if (!request && !isStopping()) {
                return;
            }
            reply = request ? OvraDRCore::toString(answer(*request)) : stopsReply();
        } else {
            OVRA_WARN("A process of another user was refused on [%s]", path.c_str());
            reply = OvraDRCore::toString(apiError(
                APIError::kNoPermission, "only root and the daemon's own user may call: use root"));
        }
        if (reply.size() > kMaxFrame) {
            reply = OvraDRCore::toString(
                apiError(APIError::kTooLarge, "the reply is too large: ask for less at once"));
        }
        // A stop does not cut this short: the call was carried out, and its caller should know.
        (void)sendFrame(peer, reply, std::chrono::steady_clock::now() + kWriteTime);
    } catch (const std::exception &error) {
        OVRA_ERR("A local call could not be served: [%s]", error.what());
    }
}

bool LocalServer::Impl::isStopping() const {
    pollfd event{stopEvent.get(), POLLIN, 0};
    return poll(&event, 1, 0) > 0;
}

/// Answers those whose connection nobody has taken yet; for when nobody will any more.
void LocalServer::Impl::refuseRest() const {
    while (const UniqueFd peer{
        accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK)}) {
        (void)sendFrame(peer.get(), stopsReply(), std::chrono::steady_clock::now() + kWriteTime);
    }
}

Json::Value LocalServer::Impl::answer(const std::string &request) {
    const std::optional<LocalCall> call = parseLocalRequest(request);
    if (!call) {
        return apiError(APIError::kBadRequest, "not a request: api, version, method, params, user");
    }
    try {
        return handler(*call);
    } catch (const std::exception &error) {
        OVRA_ERR("Local call of [%s] failed: [%s]", call->api.c_str(), error.what());
    } catch (...) {
        OVRA_ERR("Local call of [%s] failed", call->api.c_str());
    }
    return apiError(APIError::kInternal, "the call failed in the daemon: see the log");
}

LocalServer::LocalServer(std::string path, LocalHandler handler, unsigned int threads)
    : impl_(std::make_unique<Impl>(std::move(path), std::move(handler), threads)) {}

LocalServer::~LocalServer() {
    stop();
}

tl::expected<void, std::string> LocalServer::start() {
    if (impl_->listener) {
        return tl::unexpected(std::string("it has been started already"));
    }
    impl_->stopEvent.reset(eventfd(0, EFD_CLOEXEC));
    if (!impl_->stopEvent) {
        return tl::unexpected("cannot start: " + OvraBase::errnoText(errno));
    }
    if (Started placed = impl_->takePlace(); !placed) {
        impl_->lock.unlock();
        return placed;
    }
    try {
        for (unsigned int i = 0; i < impl_->threadCount; ++i) {
            impl_->threads.emplace_back([impl = impl_.get()] { impl->serveConnections(); });
        }
    } catch (const std::system_error &error) {
        stop();
        return tl::unexpected(std::string("cannot start a thread: ") + error.what());
    }
    return {};
}

void LocalServer::stop() {
    if (!impl_->listener) {
        return;
    }
    const std::uint64_t one = 1;
    if (write(impl_->stopEvent.get(), &one, sizeof(one)) != sizeof(one)) {
        OVRA_ERR("The local server cannot be told to stop: [%s]",
                 OvraBase::errnoText(errno).c_str());
    }
    for (std::thread &thread : impl_->threads) {
        thread.join();
    }
    impl_->threads.clear();
    unlink(impl_->path.c_str());
    impl_->refuseRest();
    impl_->listener.reset();
    impl_->lock.unlock();
}

} // namespace OvraPlatform
