// SPDX-License-Identifier: Apache-2.0
#include "tunnel_server.h"

#include "service/rate_limit.h"

#include <ovrabase/address.h>
#include <ovradrcore/log.h>

#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <sodium.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <map>
#include <mutex>
#include <optional>
#include <thread>
#include <unordered_map>
#include <utility>
#include <vector>

namespace Farlinkd {

namespace {

using Clock = std::chrono::steady_clock;
using OvraBase::UniqueFd;
using OvraService::Listener;

constexpr int kTickMilliseconds = 250;
constexpr std::size_t kIdBytes = 16;
/// "FARLINK1 ", the caller in hexadecimal, and an end of line.
constexpr std::string_view kGreeting = "FARLINK1 ";
constexpr std::size_t kLineSize = kGreeting.size() + 2 * kIdBytes + 1;
constexpr std::size_t kChunk = std::size_t{64} * 1024;
/// Not yet taken by the other end; above this, this end is not read.
constexpr std::size_t kMaxBuffered = 2 * kChunk;

std::string newCaller() {
    std::array<unsigned char, kIdBytes> bytes{};
    randombytes_buf(bytes.data(), bytes.size());
    std::array<char, 2 * kIdBytes + 1> text{};
    sodium_bin2hex(text.data(), text.size(), bytes.data(), bytes.size());
    return text.data();
}

/// Small writes must not wait for each other; a dead peer is noticed.
void tune(int fd) {
    const int on = 1;
    setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
    setsockopt(fd, SOL_SOCKET, SO_KEEPALIVE, &on, sizeof on);
}

struct Socket {
    enum class Kind { kListener, kTunnel, kArriving, kWaiting, kConnected };

    UniqueFd fd;
    Kind kind = Kind::kListener;
    std::string alias;       ///< of a door, a caller, and an appliance that is connected
    std::string client;      ///< of a caller, and of an appliance
    bool calls = false;      ///< a caller
    std::string text;        ///< the caller's id; of one that arrives, the line so far
    Socket *peer = nullptr;  ///< once connected
    std::string out;         ///< what the peer said and this end has not taken yet
    std::size_t written = 0; ///< of `out`
    bool ended = false;      ///< nothing more comes from this end
    bool shut = false;       ///< and nothing more goes to it
    Clock::time_point since = Clock::now();
};

} // namespace

struct TunnelServer::Impl {
    using Kind = Socket::Kind;

    Impl(Announce announceCaller, const Limits &bounds)
        : announce(std::move(announceCaller))
        , limits(bounds) {}

    struct Command {
        std::string alias;
        Listener listener; ///< without a socket: close
    };

    void run();
    void runCommands();
    Socket *add(UniqueFd fd, Kind kind, const std::string &alias, std::uint32_t events);
    void handle(int fd, std::uint32_t events);
    void acceptCallers(const Socket &listening);
    void acceptCaller(const std::string &alias, UniqueFd fd, const std::string &client);
    void acceptAppliances(const Socket &tunnel);
    void readLine(Socket &socket);
    void connectThrough(Socket &caller, Socket &appliance);
    void pass(Socket &from);
    bool flush(Socket &to);
    void setInterest(Socket &socket) const;
    void drop(Socket &socket);
    void remove(int fd);
    void closeAlias(const std::string &alias);
    void endOverdue();
    template <typename IsOne>
    [[nodiscard]] std::optional<Socket *> placeFor(const IsOne &isOne, std::size_t most,
                                                   const std::string &client) const;
    Socket *findWaiting(const std::string &caller);

    const Announce announce;
    const Limits limits;
    UniqueFd epoll;
    UniqueFd wake;
    std::mutex mutex; ///< of the two below
    std::vector<Command> commands;
    bool stopping = false;
    std::unordered_map<int, std::unique_ptr<Socket>> sockets; ///< of the thread alone
    /// The same. Open until the events of this turn are handled: the next socket would get the
    /// number, and an event that is not its own.
    std::vector<std::unique_ptr<Socket>> removed;
    OvraService::RateLimit linesOfRefusals{1, std::chrono::minutes(1)}; ///< the same
    std::thread thread;
};

/// \return null if it cannot be watched
Socket *TunnelServer::Impl::add(UniqueFd fd, Kind kind, const std::string &alias,
                                std::uint32_t events) {
    auto socket = std::make_unique<Socket>();
    socket->kind = kind;
    socket->alias = alias;
    const int number = fd.get();
    socket->fd = std::move(fd);
    epoll_event event{};
    event.events = events;
    event.data.fd = number;
    if (epoll_ctl(epoll.get(), EPOLL_CTL_ADD, number, &event) != 0) {
        return nullptr;
    }
    return (sockets[number] = std::move(socket)).get();
}

namespace {

/// The one that has waited longest; std::nullopt if none waits.
std::optional<Socket *> oldestOf(const std::vector<Socket *> &among) {
    std::optional<Socket *> oldest;
    for (Socket *const each : among) {
        if (each->kind != Socket::Kind::kConnected && (!oldest || each->since < (*oldest)->since)) {
            oldest = each;
        }
    }
    return oldest;
}

} // namespace

/// Whose place one more socket of the client may take: null for a free one, std::nullopt if there
/// is none for it. \param isOne  which sockets have such a place \param most   how many there may
/// be
template <typename IsOne>
std::optional<Socket *> TunnelServer::Impl::placeFor(const IsOne &isOne, std::size_t most,
                                                     const std::string &client) const {
    std::map<std::string, std::vector<Socket *>> byClient;
    std::size_t all = 0;
    for (const auto &[fd, socket] : sockets) {
        if (isOne(*socket)) {
            byClient[socket->client].push_back(socket.get());
            ++all;
        }
    }
    const std::vector<Socket *> &own = byClient[client];
    if (own.size() >= std::max<std::size_t>(most / limits.clientsShare, 1)) {
        // An appliance says its line at once, so the silent one is none.
        return own.front()->kind == Kind::kArriving ? oldestOf(own) : std::nullopt;
    }
    if (all < most) {
        return nullptr;
    }
    const std::vector<Socket *> &greatest =
        std::max_element(byClient.begin(), byClient.end(), [](const auto &a, const auto &b) {
            return a.second.size() < b.second.size();
        })->second;
    return greatest.size() > own.size() + 1 ? oldestOf(greatest) : std::nullopt;
}

Socket *TunnelServer::Impl::findWaiting(const std::string &caller) {
    for (const auto &[fd, socket] : sockets) {
        if (socket->kind == Kind::kWaiting && socket->text == caller) {
            return socket.get();
        }
    }
    return nullptr;
}

/// Both ends of a call close together.
void TunnelServer::Impl::drop(Socket &socket) {
    const int fd = socket.fd.get();
    const int other = socket.peer == nullptr ? -1 : socket.peer->fd.get();
    remove(fd);
    remove(other);
}

void TunnelServer::Impl::remove(int fd) {
    if (auto node = sockets.extract(fd)) {
        removed.push_back(std::move(node.mapped()));
    }
}

void TunnelServer::Impl::closeAlias(const std::string &alias) {
    std::vector<int> all;
    for (const auto &[fd, socket] : sockets) {
        if (socket->alias == alias) {
            all.push_back(fd);
        }
    }
    for (const int fd : all) {
        remove(fd);
    }
}

void TunnelServer::Impl::runCommands() {
    std::uint64_t ignored = 0;
    [[maybe_unused]] const ssize_t size = read(wake.get(), &ignored, sizeof ignored);
    std::vector<Command> now;
    {
        const std::lock_guard lock(mutex);
        now.swap(commands);
    }
    for (Command &command : now) {
        closeAlias(command.alias);
        if (command.listener.socket) {
            add(std::move(command.listener.socket), Kind::kListener, command.alias, EPOLLIN);
        }
    }
}

/// The next connection that waits at the listening socket, and its client.
std::pair<UniqueFd, std::string> acceptNext(int listener) {
    OvraBase::SocketAddress address;
    address.size = sizeof address.storage;
    UniqueFd fd(accept4(listener, reinterpret_cast<sockaddr *>(&address.storage), &address.size,
                        SOCK_NONBLOCK | SOCK_CLOEXEC));
    std::string client = fd ? OvraBase::clientKey(OvraBase::addressText(address.get())) : "";
    return {std::move(fd), std::move(client)};
}

void TunnelServer::Impl::acceptCallers(const Socket &listening) {
    const std::string alias = listening.alias;
    const int listener = listening.fd.get();
    for (;;) {
        auto [fd, client] = acceptNext(listener);
        if (!fd) {
            return;
        }
        acceptCaller(alias, std::move(fd), client);
    }
}

void TunnelServer::Impl::acceptCaller(const std::string &alias, UniqueFd fd,
                                      const std::string &client) {
    const auto callsAlias = [&alias](const Socket &socket) {
        return socket.calls && socket.alias == alias;
    };
    const auto ofAlias = placeFor(callsAlias, limits.perAlias, client);
    const Socket *const leaving = ofAlias.value_or(nullptr);
    const auto stays = [leaving](const Socket &socket) {
        return socket.calls && &socket != leaving;
    };
    const auto ofAll = placeFor(stays, limits.calls, client);
    if (!ofAlias || !ofAll) {
        if (linesOfRefusals.allow(client, Clock::now())) {
            OVRA_NOTICE("A caller of [%s] from [%s] is turned away: too many at once",
                        alias.c_str(), client.c_str());
        }
        return;
    }
    const std::string caller = newCaller();
    if (!announce(alias, caller, client)) {
        return; // closing it says so
    }
    for (Socket *const victim : {*ofAlias, *ofAll}) {
        if (victim != nullptr) {
            drop(*victim);
        }
    }
    tune(fd.get());
    // Nothing is read before there is a receiver.
    if (Socket *const added = add(std::move(fd), Kind::kWaiting, alias, EPOLLRDHUP)) {
        added->text = caller;
        added->client = client;
        added->calls = true;
    }
}

void TunnelServer::Impl::acceptAppliances(const Socket &tunnel) {
    const auto arrives = [](const Socket &socket) { return socket.kind == Kind::kArriving; };
    const int listener = tunnel.fd.get();
    for (;;) {
        auto [fd, client] = acceptNext(listener);
        if (!fd) {
            return;
        }
        const auto place = placeFor(arrives, limits.arriving, client);
        if (!place) {
            continue;
        }
        if (*place != nullptr) {
            drop(**place);
        }
        tune(fd.get());
        if (Socket *const added = add(std::move(fd), Kind::kArriving, "", EPOLLIN)) {
            added->client = client;
        }
    }
}

/// Byte by byte as far as the line goes: what follows it is the caller's.
void TunnelServer::Impl::readLine(Socket &socket) {
    std::array<char, kLineSize> buffer{};
    const ssize_t size = recv(socket.fd.get(), buffer.data(), kLineSize - socket.text.size(), 0);
    if (size < 0 && (errno == EAGAIN || errno == EINTR)) {
        return;
    }
    if (size <= 0) {
        drop(socket);
        return;
    }
    socket.text.append(buffer.data(), static_cast<std::size_t>(size));
    if (socket.text.size() < kLineSize) {
        return;
    }
    Socket *const caller = socket.text.starts_with(kGreeting) && socket.text.ends_with('\n')
                               ? findWaiting(socket.text.substr(kGreeting.size(), 2 * kIdBytes))
                               : nullptr;
    if (caller == nullptr) {
        drop(socket);
        return;
    }
    connectThrough(*caller, socket);
}

void TunnelServer::Impl::connectThrough(Socket &caller, Socket &appliance) {
    appliance.alias = caller.alias;
    caller.peer = &appliance;
    appliance.peer = &caller;
    for (Socket *end : {&caller, &appliance}) {
        end->kind = Kind::kConnected;
        end->since = Clock::now();
        setInterest(*end);
    }
}

void TunnelServer::Impl::setInterest(Socket &socket) const {
    epoll_event event{};
    if (socket.ended && socket.shut) {
        // It would go on to tell that it has ended, while the peer still takes its last bytes.
        epoll_ctl(epoll.get(), EPOLL_CTL_DEL, socket.fd.get(), nullptr);
        return;
    }
    event.data.fd = socket.fd.get();
    const bool reads = !socket.ended && socket.peer->out.size() < kMaxBuffered;
    event.events =
        (reads ? std::uint32_t{EPOLLIN} : 0U) | (socket.out.empty() ? 0U : std::uint32_t{EPOLLOUT});
    epoll_ctl(epoll.get(), EPOLL_CTL_MOD, socket.fd.get(), &event);
}

/// Writes what waits for this end; false if the end is gone.
bool TunnelServer::Impl::flush(Socket &to) {
    while (to.written < to.out.size()) {
        const ssize_t size =
            send(to.fd.get(), to.out.data() + to.written, to.out.size() - to.written, MSG_NOSIGNAL);
        if (size < 0 && errno == EINTR) {
            continue;
        }
        if (size < 0) {
            return errno == EAGAIN;
        }
        to.written += static_cast<std::size_t>(size);
    }
    to.out.clear();
    to.written = 0;
    if (to.peer->ended && !to.shut) {
        to.shut = true;
        shutdown(to.fd.get(), SHUT_WR);
    }
    return true;
}

/// Carries data from `from` to its peer, as far as the peer accepts it.
void TunnelServer::Impl::pass(Socket &from) {
    Socket &to = *from.peer;
    thread_local std::array<char, kChunk> buffer;
    while (!from.ended && to.out.size() < kMaxBuffered) {
        const ssize_t size = recv(from.fd.get(), buffer.data(), buffer.size(), 0);
        if (size < 0 && errno == EINTR) {
            continue;
        }
        if (size < 0 && errno == EAGAIN) {
            break;
        }
        if (size < 0) {
            drop(from);
            return;
        }
        from.ended = size == 0;
        to.out.append(buffer.data(), static_cast<std::size_t>(size));
        from.since = to.since = Clock::now();
    }
    if (!flush(to) || !flush(from) || (from.shut && to.shut)) {
        drop(from);
        return;
    }
    setInterest(from);
    setInterest(to);
}

void TunnelServer::Impl::handle(int fd, std::uint32_t events) {
    const auto found = sockets.find(fd);
    if (found == sockets.end()) {
        return; // gone since the event came
    }
    Socket &socket = *found->second;
    switch (socket.kind) {
    case Kind::kListener:
        acceptCallers(socket);
        break;
    case Kind::kTunnel:
        acceptAppliances(socket);
        break;
    case Kind::kArriving:
        readLine(socket);
        break;
    case Kind::kWaiting:
        // A caller that hangs up before an answer.
        drop(socket);
        break;
    case Kind::kConnected:
        if ((events & EPOLLERR) != 0) {
            drop(socket);
        } else {
            pass(socket);
        }
        break;
    }
}

void TunnelServer::Impl::endOverdue() {
    const auto now = Clock::now();
    std::vector<int> overdue;
    for (const auto &[fd, socket] : sockets) {
        const auto age = now - socket->since;
        const bool late = (socket->kind == Kind::kArriving && age > limits.line) ||
                          (socket->kind == Kind::kWaiting && age > limits.answer) ||
                          (socket->kind == Kind::kConnected && age > limits.idle);
        if (late) {
            overdue.push_back(fd);
        }
    }
    for (const int fd : overdue) {
        if (const auto found = sockets.find(fd); found != sockets.end()) {
            drop(*found->second);
        }
    }
}

void TunnelServer::Impl::run() {
    std::array<epoll_event, 64> events{};
    auto swept = Clock::now();
    for (;;) {
        const int ready = epoll_wait(epoll.get(), events.data(), static_cast<int>(events.size()),
                                     kTickMilliseconds);
        {
            const std::lock_guard lock(mutex);
            if (stopping) {
                return;
            }
        }
        for (int i = 0; i < ready; ++i) {
            const epoll_event &event = events.at(static_cast<std::size_t>(i));
            if (event.data.fd == wake.get()) {
                runCommands();
            } else {
                handle(event.data.fd, event.events);
            }
        }
        if (Clock::now() - swept >= std::chrono::milliseconds(kTickMilliseconds)) {
            endOverdue();
            swept = Clock::now();
        }
        removed.clear();
    }
}

TunnelServer::TunnelServer(Announce announce, const Limits &limits)
    : impl_(std::make_unique<Impl>(std::move(announce), limits)) {}

TunnelServer::~TunnelServer() {
    {
        const std::lock_guard lock(impl_->mutex);
        impl_->stopping = true;
    }
    if (impl_->thread.joinable()) {
        eventfd_write(impl_->wake.get(), 1);
        impl_->thread.join();
    }
}

OvraBase::Expected<void> TunnelServer::start(Listener tunnel) {
    impl_->epoll.reset(epoll_create1(EPOLL_CLOEXEC));
    impl_->wake.reset(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.fd = impl_->wake.get();
    if (!impl_->epoll || !impl_->wake ||
        epoll_ctl(impl_->epoll.get(), EPOLL_CTL_ADD, impl_->wake.get(), &event) != 0) {
        return OvraBase::Unexpected(
            {"the tunnel server cannot start: raise the limit of open files"});
    }
    impl_->add(std::move(tunnel.socket), Socket::Kind::kTunnel, "", EPOLLIN);
    impl_->thread = std::thread([this] { impl_->run(); });
    return {};
}

void TunnelServer::open(const std::string &alias, Listener listener) {
    {
        const std::lock_guard lock(impl_->mutex);
        impl_->commands.push_back({alias, std::move(listener)});
    }
    eventfd_write(impl_->wake.get(), 1);
}

void TunnelServer::close(const std::string &alias) {
    open(alias, Listener());
}

} // namespace Farlinkd
