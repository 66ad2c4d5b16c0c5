// SPDX-License-Identifier: Apache-2.0
#include "daemon.h"

#include "cgi/session_store.h"
#include "core/appliance.h"
#include "credential/sealed_box.h"
#include "farlink_agent.h"
#include "gateway.h"
#include "handlers/auth.h"
#include "handlers/handlers.h"
#include "lanes.h"
#include "listener.h"
#include "ovradrnode/dr_node.h"
#include "ovradrnode/node_db.h"
#include "release_retries.h"
#include "tls_identity.h"
#include "webapi/api_registry.h"
#include "webapi/local_server.h"

#include <unistd.h>

#include <optional>
#include <utility>

namespace Ovradrd {

namespace {

using OvraPlatform::LocalCall;

bool exists(const char *path) {
    return access(path, F_OK) == 0;
}

/// Whether `ovradr setup` has been here.
bool isSetUp(std::string &why) {
    for (const char *path : {OvraPlatform::kTlsKeyFile, OvraPlatform::kTlsCertificateFile,
                             OvraPlatform::kSealKeyFile}) {
        if (!exists(path)) {
            why = std::string("this appliance is not set up (") + path +
                  " is missing): run ovradr setup";
            return false;
        }
    }
    if (OvraDRNode::NodeDBHandler::GetHandler().GetSchemaVersion() < 0) {
        why = "this appliance is not set up (the node database cannot be read): run ovradr setup";
        return false;
    }
    return true;
}

} // namespace

struct Daemon::Impl {
    explicit Impl(Settings chosen)
        : settings(std::move(chosen)) {}

    bool loadKeys(std::string &why);
    void addHandlers();
    Outcome openPorts(std::vector<Listener> &listeners, int &port, std::string &why) const;

    Settings settings;
    int httpsPort = 0;
    int httpPort = 0;
    std::optional<TlsIdentity> identity;
    std::optional<OvraPlatform::SealKeyPair> keys;
    OvraPlatform::ReplayGuard guard;
    LoginDesk desk;
    OvraPlatform::APIRegistry registry;
    std::optional<Gateway> gateway;
    std::optional<FarlinkAgent> farlink;
    // Their threads use everything above.
    std::optional<ReleaseRetries> retries;
    std::optional<Lanes> lanes;
    std::optional<HttpServer> http;
    std::optional<OvraPlatform::LocalServer> local;
};

bool Daemon::Impl::loadKeys(std::string &why) {
    identity = TlsIdentity::load(OvraPlatform::kTlsKeyFile, OvraPlatform::kTlsCertificateFile, why);
    if (!identity) {
        return false;
    }
    keys = OvraPlatform::SealKeyPair::load(OvraPlatform::kSealKeyFile, why);
    return keys.has_value();
}

void Daemon::Impl::addHandlers() {
    desk.addTo(registry);
    addEncryptionAPI(registry, *keys, guard);
    addUserAPI(registry);
    addFarlinkAPI(registry, *farlink);
    addNodeAPI(registry);
    addSpeedAPI(registry);
    addNodeSessionAPI(registry);
    addCredentialAPI(registry);
    // From here on what the library asks of its own appliance is answered in this process.
    registry.host();
}

/// One socket for each address, all at the same port.
/// \param port  0: takes the port that was free
Outcome Daemon::Impl::openPorts(std::vector<Listener> &listeners, int &port,
                                std::string &why) const {
    const std::vector<std::string> everywhere = {""};
    for (const std::string &address :
         settings.addresses.empty() ? everywhere : settings.addresses) {
        Listener listener = Listener::listen(address, port);
        if (listener.problem != Listener::Problem::kNone) {
            why = listener.why;
            return listener.problem == Listener::Problem::kPortInUse ? Outcome::kPortInUse
                                                                     : Outcome::kFailed;
        }
        port = listener.port;
        listeners.push_back(std::move(listener));
    }
    return Outcome::kOk;
}

Daemon::Daemon(Settings settings)
    : impl_(std::make_unique<Impl>(std::move(settings))) {}

Daemon::~Daemon() {
    stop();
}

Outcome Daemon::start(std::string &why) {
    Impl &self = *impl_;
    if (!isSetUp(why)) {
        return Outcome::kNotSetUp;
    }
    if (OvraDRNode::DRNode::getLocalNodeId().empty()) {
        why = "the node id can be neither read nor made: see the log, and check that the disk is "
              "neither full nor read-only";
        return Outcome::kFailed;
    }
    if (!self.loadKeys(why)) {
        return Outcome::kFailed;
    }
    std::vector<Listener> https;
    std::vector<Listener> http;
    self.httpsPort = self.settings.httpsPort;
    self.httpPort = self.settings.httpPort;
    for (const auto &[listeners, port] :
         {std::pair{&https, &self.httpsPort}, {&http, &self.httpPort}}) {
        if (const Outcome outcome = self.openPorts(*listeners, *port, why);
            outcome != Outcome::kOk) {
            return outcome;
        }
    }
    self.farlink.emplace([&self](ConnectedClient client) { self.http->adopt(std::move(client)); });
    self.addHandlers();
    self.lanes.emplace();
    self.retries.emplace(self.lanes->slow);
    self.gateway.emplace(self.registry, *self.keys, self.guard, self.desk, *self.lanes);
    self.local.emplace(OvraPlatform::kSocketFile,
                       [&self](const LocalCall &call) { return self.gateway->serveLocal(call); });
    if (!self.local->start(why)) {
        return Outcome::kFailed;
    }
    self.http.emplace(
        [&self](HttpRequest request, const HttpServer::Answer &answer) {
            self.gateway->serve(std::move(request), answer);
        },
        self.settings.limits);
    if (!self.http->start(std::move(https), std::move(http), *self.identity, why)) {
        return Outcome::kFailed;
    }
    self.farlink->start();
    return Outcome::kOk;
}

int Daemon::httpsPort() const {
    return impl_->httpsPort;
}

int Daemon::httpPort() const {
    return impl_->httpPort;
}

void Daemon::tend() {
    OvraPlatform::SessionStore().sweep();
    impl_->retries->begin();
}

bool Daemon::stop() {
    Impl &self = *impl_;
    if (self.http) {
        self.http->quiesce();
    }
    const auto deadline = std::chrono::steady_clock::now() + kGrace;
    bool ended = true;
    if (self.farlink) {
        // It may be waiting for callers for some time yet.
        ended = self.farlink->stop(std::chrono::steady_clock::now());
    }
    if (self.lanes) {
        for (Lane *lane : {&self.lanes->login, &self.lanes->slow, &self.lanes->quick}) {
            ended = lane->stop(deadline) && ended;
        }
    }
    if (self.gateway) {
        self.gateway->leaveLocal();
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
