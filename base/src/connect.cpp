// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/connect.h"

#include <fcntl.h>
#include <netdb.h>
#include <poll.h>
#include <pthread.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <exception>
#include <future>
#include <iterator>
#include <memory>
#include <optional>
#include <system_error>
#include <thread>
#include <utility>

namespace OvraBase {

namespace {

using Clock = std::chrono::steady_clock;
using Addresses = std::vector<SocketAddress>;

/// The "connection attempt delay" that RFC 8305, 8, recommends.
constexpr std::chrono::milliseconds kAttemptDelay{250};

/// 0, or the errno for which no descriptor can be had now.
int shortageOfDescriptors() {
    const UniqueFd any(open("/", O_PATH | O_CLOEXEC));
    return any || !isShortage(errno) ? 0 : errno;
}

Expected<Addresses> lookUp(const std::string &host, int port) {
    addrinfo hints{};
    hints.ai_socktype = SOCK_STREAM;
    addrinfo *list = nullptr;
    const int error = getaddrinfo(host.c_str(), std::to_string(port).c_str(), &hints, &list);
    const int cause = errno;
    const std::unique_ptr<addrinfo, decltype(&freeaddrinfo)> owner(list, &freeaddrinfo);
    if (error == EAI_MEMORY || (error == EAI_SYSTEM && isShortage(cause))) {
        return systemError(error == EAI_MEMORY ? ENOMEM : cause);
    }
    if (error != 0) {
        // The resolver says "try again" or "not known" as well if it cannot open its files.
        const int shortage = shortageOfDescriptors();
        return shortage != 0 ? systemError(shortage) : Unexpected(Error{gai_strerror(error), 0});
    }
    Addresses found;
    for (const addrinfo *entry = list; entry != nullptr; entry = entry->ai_next) {
        SocketAddress address;
        if (entry->ai_addrlen <= sizeof address.storage) {
            std::memcpy(&address.storage, entry->ai_addr, entry->ai_addrlen);
            address.size = entry->ai_addrlen;
            found.push_back(address);
        }
    }
    return found;
}

/// Whether connect(2) has no address of ours to come from. It gives the same errno if the local
/// ports of TCP are used up; those of UDP are others. Nothing is sent.
bool lacksLocalAddress(const SocketAddress &peer) {
    const UniqueFd fd(socket(peer.storage.ss_family, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    return fd && connect(fd.get(), peer.get(), peer.size) != 0 && errno == EADDRNOTAVAIL;
}

/// Starts a thread that the signals of the process do not reach. \return 0, or the errno
template <typename Task>
int startQuietly(Task task) {
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    int error = 0;
    try {
        std::thread(std::move(task)).detach();
    } catch (const std::system_error &failure) {
        error = failure.code().value();
    }
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    return error;
}

/// The first address, then in turn one of each family, otherwise in the given order.
Addresses takeFamiliesInTurn(const Addresses &given) {
    Addresses first;
    Addresses second;
    for (const SocketAddress &address : given) {
        (address.isIpv6() == given.front().isIpv6() ? first : second).push_back(address);
    }
    Addresses turns;
    for (std::size_t i = 0; i < std::max(first.size(), second.size()); ++i) {
        for (const Addresses *family : {&first, &second}) {
            if (i < family->size()) {
                turns.push_back((*family)[i]);
            }
        }
    }
    return turns;
}

/// Attempts that run side by side.
class Race {
public:
    Race(Addresses addresses, Deadline deadline)
        : waiting_(std::move(addresses))
        , deadline_(deadline) {}

    Expected<Connection> run() {
        for (;;) {
            while (next_ < waiting_.size() && (running_.empty() || Clock::now() >= nextStart_)) {
                if (auto connected = start(waiting_[next_++])) {
                    return std::move(*connected);
                }
            }
            if (running_.empty()) {
                return systemError(shortage_ != 0 ? shortage_ : lastError_);
            }
            if (Clock::now() >= deadline_) {
                return systemError(ETIMEDOUT);
            }
            if (auto connected = wait()) {
                return std::move(*connected);
            }
        }
    }

private:
    /// The connection, if it is there at once.
    std::optional<Connection> start(const SocketAddress &address) {
        UniqueFd fd(socket(address.storage.ss_family, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC,
                           IPPROTO_TCP));
        if (fd && connect(fd.get(), address.get(), address.size) == 0) {
            return Connection{std::move(fd), address};
        }
        if (fd && errno == EINPROGRESS) {
            running_.push_back({std::move(fd), address});
            nextStart_ = Clock::now() + kAttemptDelay;
        } else {
            const int error = errno;
            fail(error == EADDRNOTAVAIL && lacksLocalAddress(address) ? ENETUNREACH : error);
        }
        return std::nullopt;
    }

    /// Notes it, and lets the next attempt start at once.
    void fail(int error) {
        (isShortage(error) ? shortage_ : lastError_) = error;
        nextStart_ = Clock::time_point::min();
    }

    /// Waits until one connects or fails, or it is time for the next.
    std::optional<Connection> wait() {
        std::vector<pollfd> polled;
        for (const Connection &each : running_) {
            polled.push_back({each.socket.get(), POLLOUT, 0});
        }
        const auto end = next_ < waiting_.size() ? std::min(nextStart_, deadline_) : deadline_;
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(end - Clock::now()).count();
        if (poll(polled.data(), polled.size(), static_cast<int>(std::max<long>(left, 0))) < 0) {
            return std::nullopt;
        }
        for (std::size_t i = polled.size(); i-- > 0;) {
            if (polled[i].revents == 0) {
                continue;
            }
            int error = 0;
            socklen_t size = sizeof error;
            if (getsockopt(polled[i].fd, SOL_SOCKET, SO_ERROR, &error, &size) == 0 && error == 0) {
                return std::move(running_[i]);
            }
            running_.erase(running_.begin() + static_cast<std::ptrdiff_t>(i));
            fail(error);
        }
        return std::nullopt;
    }

    Addresses waiting_;
    std::size_t next_ = 0;
    Deadline deadline_;
    Clock::time_point nextStart_ = Clock::time_point::min();
    std::vector<Connection> running_;
    int lastError_ = ENETUNREACH;
    int shortage_ = 0;
};

} // namespace

bool isShortage(int number) {
    return number == EMFILE || number == ENFILE || number == ENOMEM || number == ENOBUFS ||
           number == EAGAIN || number == EADDRNOTAVAIL;
}

Expected<std::vector<SocketAddress>> resolveHost(const std::string &host, int port,
                                                 Deadline deadline) {
    if (const auto numeric = parseAddress(host, port)) {
        return Addresses{*numeric};
    }
    std::promise<Expected<Addresses>> answer;
    std::future<Expected<Addresses>> found = answer.get_future();
    const int error = startQuietly([host, port, answer = std::move(answer)]() mutable {
        try {
            answer.set_value(lookUp(host, port));
        } catch (const std::exception &) {
            answer.set_exception(std::current_exception());
        }
    });
    if (error != 0) {
        return systemError(error);
    }
    if (found.wait_until(deadline) != std::future_status::ready) {
        return systemError(ETIMEDOUT);
    }
    return found.get();
}

Expected<Connection> connectFirst(std::vector<SocketAddress> addresses, Deadline deadline) {
    return Race(addresses.size() > 1 ? takeFamiliesInTurn(addresses) : std::move(addresses),
                deadline)
        .run();
}

} // namespace OvraBase
