// SPDX-License-Identifier: Apache-2.0
#include "daemon.h"

#include "call_dispatcher.h"
#include "farlink_agent.h"
#include "handlers/auth.h"
#include "handlers/handlers.h"
#include "handlers/invite.h"
#include "peer_watch.h"
#include "release_retries.h"
#include "service/listener.h"
#include "service/tls_identity.h"
#include "service/work_queue.h"
#include "session_uses.h"
#include "test_files.h"

#include <ovrabase/address.h>
#include <ovradrcore/cache_folder.h>
#include <ovradrcore/log.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_db.h>
#include <ovraplatform/api_registry.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/local_server.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/session_store.h>

#include <unistd.h>

#include <cerrno>
#include <optional>
#include <utility>

namespace Ovradrd {

namespace {

using OvraBase::Expected;
using OvraPlatform::LocalCall;
using OvraService::ConnectedClient;
using OvraService::ExitCode;
using OvraService::HttpRequest;
using OvraService::HttpServer;
using OvraService::Listener;
using OvraService::StartError;
using OvraService::TlsIdentity;
using OvraService::WorkQueue;

bool exists(const char *path) {
    return access(path, F_OK) == 0;
}

tl::unexpected<StartError> failed(const OvraBase::Error &why) {
    StartError error(why);
    if (why.number == EADDRINUSE) {
        error.exit = ExitCode::kPortInUse;
    }
    return tl::unexpected(error);
}

tl::unexpected<StartError> notSetUp(const std::string &what) {
    return tl::unexpected(StartError(ExitCode::kNotSetUp, "this appliance is not set up (" + what +
                                                              "): run ovradr setup"));
}

/// Whether `ovradr setup` has run.
tl::expected<void, StartError> checkSetUp() {
    for (const char *path : {OvraPlatform::kTlsKeyFile, OvraPlatform::kTlsCertificateFile,
                             OvraPlatform::kSealKeyFile}) {
        if (!exists(path)) {
            return notSetUp(std::string(path) + " is missing");
        }
    }
    auto database = OvraDRNode::NodeDBHandler::GetHandler();
    const int version = database.GetSchemaVersion();
    if (version < 0) {
        return notSetUp("the node database cannot be read (" + database.GetErrMsg().asString() +
                        ")");
    }
    if (version > OvraDRNode::kNodeSchemaVersion) {
        return tl::unexpected(StartError(
            ExitCode::kNotSetUp, "the node database has schema " + std::to_string(version) +
                                     ", which is newer than this program: install the version "
                                     "that made it"));
    }
    return {};
}

} // namespace

struct Daemon::Impl {
    explicit Impl(Settings chosen)
        : settings(std::move(chosen)) {}

    Expected<void> loadKeys();
    void addHandlers();
    Expected<std::vector<Listener>> openPorts(int port) const;

    Settings settings;
    int httpsPort = 0;
    int httpPort = 0;
    std::optional<TlsIdentity> identity;
    std::optional<OvraPlatform::SealKeyPair> keys;
    OvraPlatform::ReplayGuard guard;
    LoginApi loginApi;
    InviteApi inviteApi;
    SessionUses uses;
    OvraPlatform::APIRegistry registry;
    std::optional<CallDispatcher> dispatcher;
    std::optional<FarlinkAgent> farlink;
    // Their threads use everything above.
    std::optional<ReleaseRetries> retries;
    std::optional<PeerWatch> watch;
    std::optional<WorkQueues> queues;
    std::optional<HttpServer> http;
    std::optional<OvraPlatform::LocalServer> local;
};

Expected<void> Daemon::Impl::loadKeys() {
    auto tls = TlsIdentity::load(OvraPlatform::kTlsKeyFile, OvraPlatform::kTlsCertificateFile);
    if (!tls) {
        return OvraBase::Unexpected(tls.error());
    }
    identity = std::move(*tls);
    auto pair = OvraPlatform::SealKeyPair::load(OvraPlatform::kSealKeyFile);
    if (!pair) {
        return OvraBase::Unexpected({pair.error()});
    }
    keys = std::move(*pair);
    return {};
}

void Daemon::Impl::addHandlers() {
    loginApi.addTo(registry);
    inviteApi.addTo(registry);
    addEncryptionAPI(registry, *keys, guard);
    addUserAPI(registry);
    addFarlinkAPI(registry, *farlink);
    addNodeAPI(registry);
    addStatusAPI(registry, *keys, {*watch, uses});
    addSpeedAPI(registry);
    addNodeSessionAPI(registry);
    addCredentialAPI(registry);
    // From here on this process answers the library's calls to its own appliance.
    registry.host();
}

/// One socket for each address, all at the same port.
/// \param port  0: one that is free
Expected<std::vector<Listener>> Daemon::Impl::openPorts(int port) const {
    const std::vector<std::string> everywhere = {""};
    std::vector<Listener> listeners;
    for (const std::string &address :
         settings.addresses.empty() ? everywhere : settings.addresses) {
        Expected<Listener> listener = Listener::listen(address, port);
        if (!listener) {
            return OvraBase::Unexpected(listener.error());
        }
        port = listener->port;
        listeners.push_back(std::move(*listener));
    }
    return listeners;
}

Daemon::Daemon(Settings settings)
    : impl_(std::make_unique<Impl>(std::move(settings))) {}

Daemon::~Daemon() {
    stop();
}

tl::expected<void, StartError> Daemon::start() {
    Impl &self = *impl_;
    if (auto ready = checkSetUp(); !ready) {
        return ready;
    }
    if (OvraDRNode::DRNode::getLocalNodeId().empty()) {
        return failed({"the node id can be neither read nor made: see the log, and check that the "
                       "disk is neither full nor read-only"});
    }
    if (const std::string problem = OvraDRCore::prepareCacheFolder(OvraPlatform::kCacheDir);
        !problem.empty()) {
        OVRA_ERR("The folder of the caches [%s] %s; goes on without them", OvraPlatform::kCacheDir,
                 problem.c_str());
    }
    if (const Expected<void> loaded = self.loadKeys(); !loaded) {
        return failed(loaded.error());
    }
    Expected<std::vector<Listener>> https = self.openPorts(self.settings.httpsPort);
    if (!https) {
        return failed(https.error());
    }
    Expected<std::vector<Listener>> http = self.openPorts(self.settings.httpPort);
    if (!http) {
        return failed(http.error());
    }
    self.httpsPort = https->front().port;
    self.httpPort = http->front().port;
    self.farlink.emplace([&self](ConnectedClient client) {
        self.loginApi.noteRelay(
            OvraBase::addressText(reinterpret_cast<const sockaddr *>(&client.address)));
        self.http->adopt(std::move(client));
    });
    self.loginApi.recall();
    self.queues.emplace();
    self.retries.emplace(self.queues->outbound);
    self.watch.emplace(self.queues->watch);
    self.addHandlers();
    self.dispatcher.emplace(self.registry, *self.keys, self.guard, self.loginApi, self.uses,
                            *self.queues, self.settings.logsCalls);
    self.local.emplace(OvraPlatform::kSocketFile, [&self](const LocalCall &call) {
        return self.dispatcher->serveLocal(call);
    });
    if (const auto started = self.local->start(); !started) {
        return failed({started.error()});
    }
    self.http.emplace(
        [&self](HttpRequest request, const HttpServer::Answer &answer) {
            self.dispatcher->serve(std::move(request), answer);
        },
        self.settings.limits, testFiles(self.settings.testFiles),
        [&self](HttpRequest beginning, const HttpServer::Verdict &verdict) {
            self.dispatcher->judge(std::move(beginning), verdict);
        });
    if (const auto started = self.http->start(std::move(*https), std::move(*http), *self.identity);
        !started) {
        return failed(started.error());
    }
    self.farlink->start();
    return {};
}

int Daemon::httpsPort() const {
    return impl_->httpsPort;
}

int Daemon::httpPort() const {
    return impl_->httpPort;
}

Expected<bool> Daemon::reload(const Settings &settings) {
    Impl &self = *impl_;
    const auto tls =
        TlsIdentity::load(OvraPlatform::kTlsKeyFile, OvraPlatform::kTlsCertificateFile);
    if (!tls) {
        return OvraBase::Unexpected(tls.error());
    }
    if (auto renewed = self.http->renew(*tls); !renewed) {
        return OvraBase::Unexpected(renewed.error());
    }
    return settings.addresses != self.settings.addresses ||
           settings.httpPort != self.settings.httpPort ||
           settings.httpsPort != self.settings.httpsPort;
}

void Daemon::doPeriodicWork() {
    (void)OvraPlatform::SessionStore().sweep(); // the log says why not; the next one is soon
    sweepTestFiles();
    impl_->retries->begin();
    impl_->watch->round();
    impl_->dispatcher->tellRefusals();
}

bool Daemon::stop() {
    Impl &self = *impl_;
    if (self.http) {
        self.http->quiesce();
    }
    if (self.dispatcher) {
        self.dispatcher->beginStop();
    }
    const auto deadline = std::chrono::steady_clock::now() + kGrace;
    bool ended = true;
    if (self.farlink) {
        // It may be waiting for callers for some time yet.
        ended = self.farlink->stop(std::chrono::steady_clock::now());
    }
    if (self.queues) {
        WorkQueues &queues = *self.queues;
        for (WorkQueue *queue : {&queues.login, &queues.knownLogin, &queues.relay, &queues.twoWay,
                                 &queues.outbound, &queues.watch, &queues.quick}) {
            ended = queue->stop(deadline) && ended;
        }
    }
    if (self.dispatcher) {
        self.dispatcher->leaveLocal();
    }
    if (self.local) {
        self.local->stop();
    }
    if (self.http) {
        self.http->stop();
    }
    return ended;
}

} // namespace Ovradrd
