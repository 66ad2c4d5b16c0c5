// SPDX-License-Identifier: Apache-2.0
#include "farlink_agent.h"

#include <ovrabase/connect.h>
#include <ovradrcore/log.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/farlink.h>

#include <sys/socket.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <exception>
#include <mutex>
#include <optional>
#include <thread>
#include <utility>
#include <vector>

namespace Ovradrd {

namespace {

using OvraPlatform::FarlinkClient;
using OvraPlatform::FarlinkFailure;
using OvraPlatform::FarlinkKey;
using OvraPlatform::FarlinkReply;
using OvraPlatform::FarlinkSettings;

/// Between two looks at the settings while there is no alias.
constexpr std::chrono::seconds kLook{2};
constexpr std::chrono::seconds kMinPause{1};
constexpr std::chrono::seconds kMaxPause{60};
constexpr std::chrono::seconds kDialTime{5};
/// Between two enrolments.
constexpr std::chrono::hours kMaxStay{1};
/// Callers taken from one answer; a service that follows docs/wire.md never names more at once.
constexpr Json::ArrayIndex kMaxCallers = 64;
constexpr std::size_t kCallerSize = 32;

/// Connects to the tunnel port and names the caller; without a descriptor on failure.
OvraService::ConnectedClient dial(const std::string &host, int port, const std::string &caller) {
    const auto deadline = std::chrono::steady_clock::now() + kDialTime;
    auto connected = OvraBase::resolveHost(host, port, deadline)
                         .and_then([deadline](std::vector<OvraBase::SocketAddress> addresses) {
                             return OvraBase::connectFirst(std::move(addresses), deadline);
                         });
    const std::string line = "FARLINK1 " + caller + "\n";
    OvraService::ConnectedClient call;
    // The line is far smaller than the buffer of a new connection: it fits at once.
    if (connected && send(connected->socket.get(), line.data(), line.size(), MSG_NOSIGNAL) ==
                         static_cast<ssize_t>(line.size())) {
        call.fd = std::move(connected->socket);
        call.address = connected->peer.storage;
        call.size = connected->peer.size;
    }
    return call;
}

/// Hexadecimal digits and nothing else: it becomes part of a line.
bool isCaller(const Json::Value &value) {
    const std::string text = value.isString() ? value.asString() : std::string();
    return text.size() == kCallerSize &&
           text.find_first_not_of("0123456789abcdef") == std::string::npos;
}

} // namespace

struct FarlinkAgent::State {
    std::mutex mutex;
    std::condition_variable changed;
    bool stopping = false;
    bool ended = false;
    Status status;
    std::function<void(OvraService::ConnectedClient)> take; ///< empty once it stops

    /// Waits; false if the agent must stop.
    bool pause(std::chrono::seconds time) {
        std::unique_lock lock(mutex);
        return !changed.wait_for(lock, time, [this] { return stopping; });
    }
    void tell(const Status &now) {
        const std::lock_guard lock(mutex);
        if (now.connected != status.connected || now.problem != status.problem) {
            if (now.connected) {
                OVRA_NOTICE("Connected to the relay service");
            } else if (!now.problem.empty()) {
                OVRA_WARN("Not connected to the relay service: %s", now.problem.c_str());
            }
        }
        status = now;
    }
    void hand(OvraService::ConnectedClient client) {
        const std::lock_guard lock(mutex);
        if (take && client.fd) {
            take(std::move(client));
        }
    }
};

namespace {

/// Success, or what is in the way.
using Went = tl::expected<void, FarlinkFailure>;

/// One session with the relay service, under one alias.
class RelayRegistration {
public:
    explicit RelayRegistration(FarlinkSettings settings)
        : settings_(std::move(settings))
        , client_(settings_) {}

    bool isFor(const FarlinkSettings &settings) const { return settings_ == settings; }

    /// Proves who we are.
    Went begin() {
        const auto key = FarlinkKey::loadOrCreate();
        if (!key) {
            return tl::unexpected(FarlinkFailure{key.error()});
        }
        const FarlinkReply reply = client_.enrol(*key);
        if (!reply) {
            return tl::unexpected(reply.error());
        }
        token_ = reply->getDataFieldtoStr("token");
        const Json::Value port = reply->getDataField("port");
        const Json::Value tunnel = reply->getDataField("tunnel_port");
        const Json::Value expires = reply->getDataField("expires");
        if (token_.empty() || !port.isInt() || !tunnel.isInt() || !expires.isInt64()) {
            return tl::unexpected(FarlinkFailure{
                "the relay service gave an answer that is none: check that the versions fit"});
        }
        tunnelPort_ = tunnel.asInt();
        const Json::Value lease = reply->getDataField("lease");
        const std::chrono::seconds third(lease.isInt64() ? lease.asInt64() / 3 : 0);
        renewAt_ = std::chrono::steady_clock::now() +
                   std::clamp<std::chrono::seconds>(third, kMinPause, kMaxStay);
        status_.connected = true;
        status_.port = port.asInt();
        status_.expires = expires.asInt64();
        return {};
    }

    const FarlinkAgent::Status &status() const { return status_; }
    /// The lease of the alias must be renewed now and then.
    bool isOver() const { return std::chrono::steady_clock::now() >= renewAt_; }

    /// Waits for callers and connects to each of them.
    /// \param mayDial  checked first, because the settings may have changed meanwhile
    template <typename Dialled, typename MayDial>
    Went serve(const MayDial &mayDial, const Dialled &dialled) {
        const FarlinkReply reply = client_.wait(token_);
        if (!reply) {
            return tl::unexpected(reply.error());
        }
        const Json::Value callers = reply->getDataField("callers");
        for (Json::ArrayIndex i = 0; callers.isArray() && i < std::min(callers.size(), kMaxCallers);
             ++i) {
            if (isCaller(callers[i]) && mayDial()) {
                dialled(dial(settings_.host, tunnelPort_, callers[i].asString()));
            }
        }
        return {};
    }

private:
    FarlinkSettings settings_;
    FarlinkClient client_;
    std::string token_;
    int tunnelPort_ = 0;
    std::chrono::steady_clock::time_point renewAt_;
    FarlinkAgent::Status status_;
};

} // namespace

void FarlinkAgent::run(const std::shared_ptr<State> &state) {
    std::optional<RelayRegistration> registration;
    std::chrono::seconds pause{0};
    while (state->pause(pause)) {
        const auto settings = OvraPlatform::readFarlinkSettings();
        if (!settings || settings->host.empty() || settings->alias.empty()) {
            registration.reset();
            state->tell({false, 0, 0, settings ? "" : settings.error()});
            pause = kLook;
            continue;
        }
        Went went;
        if (!registration || !registration->isFor(*settings) || registration->isOver()) {
            registration.emplace(*settings);
            went = registration->begin();
        }
        bool forgotten = false;
        if (went) {
            state->tell(registration->status());
            went = registration->serve(
                [&settings] { return OvraPlatform::readFarlinkSettings() == settings; },
                [&state](OvraService::ConnectedClient client) { state->hand(std::move(client)); });
            forgotten = !went && went.error().code == OvraPlatform::APIError::kNoSession;
        }
        if (went) {
            pause = std::chrono::seconds(0);
            continue;
        }
        // If it was only forgotten, it comes back at once.
        state->tell({false, 0, 0, went.error().text});
        registration.reset();
        pause = forgotten && pause.count() == 0 ? kMinPause
                                                : std::clamp(pause * 2, kMinPause, kMaxPause);
    }
}

void FarlinkAgent::runToTheEnd(const std::shared_ptr<State> &state) {
    try {
        run(state);
    } catch (const std::exception &error) {
        OVRA_ERR("The way to the relay service broke off: [%s]", error.what());
    }
    const std::lock_guard lock(state->mutex);
    state->ended = true;
    state->changed.notify_all();
}

FarlinkAgent::FarlinkAgent(std::function<void(OvraService::ConnectedClient)> take)
    : state_(std::make_shared<State>()) {
    state_->take = std::move(take);
}

void FarlinkAgent::start() {
    thread_ = std::thread([state = state_] { runToTheEnd(state); });
}

FarlinkAgent::~FarlinkAgent() {
    if (!stop(std::chrono::steady_clock::now())) {
        thread_.detach();
    }
}

FarlinkAgent::Status FarlinkAgent::status() const {
    const std::lock_guard lock(state_->mutex);
    return state_->status;
}

bool FarlinkAgent::stop(std::chrono::steady_clock::time_point deadline) {
    std::unique_lock lock(state_->mutex);
    state_->stopping = true;
    state_->take = nullptr;
    state_->changed.notify_all();
    if (!thread_.joinable()) {
        return true;
    }
    if (!state_->changed.wait_until(lock, deadline, [this] { return state_->ended; })) {
        return false;
    }
    // What libraries keep for the thread is freed only after its function has returned.
    lock.unlock();
    thread_.join();
    return true;
}

} // namespace Ovradrd
