// SPDX-License-Identifier: Apache-2.0

// Credential requests to remote appliances, which are entries of a table.

#include "stand_in.h"

#include <ovracredential/cred_request.h>

#include <json/writer.h>

using OvraVendor::Call;
using OvraVendor::credentialLibrary;
using OvraVendor::Remote;

struct _tag_ovra_cred_ {
    std::string protocol, host, account, password;
    int port = -1;
};
struct _tag_ovra_cred_sess_ {
    std::string token;
};

namespace {

constexpr int kCannotConnect = 5;
constexpr int kInvalid = 1;
constexpr int kMaxTimeout = 86400;

std::set<const void *> &liveObjects() {
    static std::set<const void *> objects;
    return objects;
}

/// \param error  receives the number, if the operation has to fail
bool fails(const char *operation, int *error = nullptr) {
    const auto &fault = credentialLibrary().fault;
    const std::optional<int> number = fault ? fault(operation) : std::nullopt;
    if (number && error != nullptr) {
        *error = *number;
    }
    return number.has_value();
}

template <typename Object>
Object *obtain(const char *operation, OvraVendor::Live &live) {
    if (fails(operation)) {
        return nullptr;
    }
    auto *object = new Object;
    liveObjects().insert(object);
    live.obtained();
    return object;
}

template <typename Object>
void giveBack(Object *object, OvraVendor::Live &live) {
    if (object == nullptr) {
        return;
    }
    if (liveObjects().erase(object) == 0) {
        ++live.misused;
        return;
    }
    live.givenBack();
    delete object;
}

bool isLive(const OVRACred *cred) {
    const bool live = liveObjects().count(cred) == 1;
    credentialLibrary().credentials.misused += live ? 0 : 1;
    return live;
}
bool isLive(const OVRACredSess *sess) {
    const bool live = liveObjects().count(sess) == 1;
    credentialLibrary().sessions.misused += live ? 0 : 1;
    return live;
}

/// An item as the C functions take it: rejected if empty.
template <typename Object>
int setItem(const char *operation, Object *object, std::string Object::*item, const char *value) {
    if (fails(operation) || !isLive(object) || value == nullptr || *value == '\0') {
        return -1;
    }
    object->*item = value;
    return 0;
}

Remote *findRemote(const std::string &protocol, const std::string &host, int port) {
    auto &remotes = credentialLibrary().remotes;
    const auto found = remotes.find(protocol + "://" + host + ":" + std::to_string(port));
    return found != remotes.end() && found->second.reachable ? &found->second : nullptr;
}

Json::Value refusal(int code) {
    Json::Value document;
    document["success"] = false;
    document["error"]["code"] = code;
    return document;
}

} // namespace

OvraVendor::CredentialLibrary &OvraVendor::credentialLibrary() {
    static CredentialLibrary library;
    return library;
}

extern "C" {
OVRACred *OVRACredAlloc() {
    return obtain<OVRACred>(__func__, credentialLibrary().credentials);
}
void OVRACredFree(OVRACred *cred) {
    giveBack(cred, credentialLibrary().credentials);
}
OVRACredSess *OVRACredSessAlloc() {
    return obtain<OVRACredSess>(__func__, credentialLibrary().sessions);
}
void OVRACredSessFree(OVRACredSess *sess) {
    giveBack(sess, credentialLibrary().sessions);
}
int OVRACredItemSetProtocol(OVRACred *cred, const char *protocol) {
    return setItem(__func__, cred, &OVRACred::protocol, protocol);
}
int OVRACredItemSetHost(OVRACred *cred, const char *host) {
    return setItem(__func__, cred, &OVRACred::host, host);
}
int OVRACredItemSetPort(OVRACred *cred, int port) {
    if (fails(__func__) || !isLive(cred) || port < 1 || port > 65535) {
        return -1;
    }
    cred->port = port;
    return 0;
}
int OVRACredItemSetRemoteAccount(OVRACred *cred, const char *account) {
    return setItem(__func__, cred, &OVRACred::account, account);
}
int OVRACredItemSetRemotePasswd(OVRACred *cred, const char *passwd) {
    return setItem(__func__, cred, &OVRACred::password, passwd);
}
int OVRACredSessItemSetAccessToken(OVRACredSess *sess, const char *token) {
    return setItem(__func__, sess, &OVRACredSess::token, token);
}
}

namespace OVRA {

struct CredRequest::Impl {
    std::string protocol, host;
    int port = -1;
    Call call;
    std::string response;
    int error = 0;
};

CredRequest::CredRequest()
    : impl_(std::make_unique<Impl>()) {
    credentialLibrary().requests.obtained();
}

CredRequest::~CredRequest() {
    credentialLibrary().requests.givenBack();
}

int CredRequest::SetURL(const std::string &protocol, const std::string &address, int port,
                        const std::string &path) {
    if (fails(__func__) || address.empty() || path != "webapi/query.cgi") {
        return 0;
    }
    impl_->protocol = protocol;
    impl_->host = address;
    impl_->port = port;
    return 1;
}

int CredRequest::SetDefaultTimeout(long seconds) {
    return fails(__func__) ? 0 : SetResponseTimeout(seconds);
}

int CredRequest::SetResponseTimeout(long seconds) {
    if (seconds < 1 || seconds > kMaxTimeout) {
        return 0;
    }
    impl_->call.timeout = seconds;
    return 1;
}

int CredRequest::SetEncryptMode(int mode) {
    impl_->call.sealed = mode == 2;
    return 1;
}

int CredRequest::SetUploadFile(const std::string &path, const std::string &name) {
    impl_->call.uploadName = name;
    return fails(__func__) || path.empty() ? 0 : 1;
}

int CredRequest::CreateWebAPIRequest(CredRequest &req, OVRACred *cred, OVRACredSess *sess,
                                     const std::string &api, int version, const std::string &method,
                                     const Json::Value &params) {
    if (fails(__func__, &req.impl_->error)) {
        return 0;
    }
    if (!isLive(cred) || (sess != nullptr && !isLive(sess)) || api.empty() || method.empty()) {
        req.impl_->error = kInvalid;
        return 0;
    }
    req.impl_->protocol = cred->protocol;
    req.impl_->host = cred->host;
    req.impl_->port = cred->port;
    req.impl_->call.session = sess != nullptr ? sess->token : "";
    req.impl_->call.api = api;
    req.impl_->call.method = method;
    req.impl_->call.version = version;
    req.impl_->call.params = params;
    return 1;
}

int CredRequest::Process(bool reuse, int mode) {
    impl_->call.reused = reuse;
    impl_->response.clear();
    if (fails(mode == 2 ? "probe" : __func__, &impl_->error)) {
        return 0;
    }
    Remote *remote = findRemote(impl_->protocol, impl_->host, impl_->port);
    if (remote == nullptr) {
        impl_->error = kCannotConnect;
        return 0;
    }
    if (mode == 2) {
        ++remote->probes;
        impl_->error = 0;
        return 1;
    }
    impl_->error = remote->error;
    if (remote->error != 0) {
        return 0;
    }
    remote->calls.push_back(impl_->call);
    const bool known = remote->sessions.count(impl_->call.session) == 1;
    Json::Value document = refusal(119);
    if (known) {
        document = Json::Value();
        document["success"] = true;
        if (remote->answer) {
            document = remote->answer(impl_->call);
        }
    }
    impl_->response = Json::writeString(Json::StreamWriterBuilder(), document);
    return 1;
}

std::string CredRequest::GetResponse() const {
    return impl_->response;
}

int CredRequest::GetError() const {
    return impl_->error;
}

int CredRequestUtil::LoginWithOTP(OVRACred *cred, const std::string &otp, OVRACredSess *sess,
                                  Json::Value *out) {
    if (!isLive(cred) || !isLive(sess) || out == nullptr) {
        return 0;
    }
    const int done = fails(__func__) ? 0 : 1; // whatever the remote says
    Remote *remote = findRemote(cred->protocol, cred->host, cred->port);
    if (remote == nullptr) {
        *out = refusal(100);
        return 0;
    }
    if (cred->account + "/" + cred->password + "/" + otp != remote->login) {
        *out = refusal(remote->refusal);
        return done;
    }
    sess->token = "login-" + std::to_string(++remote->logins);
    remote->sessions.insert(sess->token);
    *out = Json::Value();
    (*out)["success"] = true;
    (*out)["data"]["sid"] = sess->token;
    return done;
}

int CredRequestUtil::Logout(OVRACred *cred, OVRACredSess *sess) {
    if (!isLive(cred) || !isLive(sess)) {
        return 0;
    }
    Remote *remote = findRemote(cred->protocol, cred->host, cred->port);
    const bool ended = remote != nullptr && remote->sessions.erase(sess->token) == 1;
    if (remote != nullptr) {
        ++remote->logouts;
    }
    sess->token.clear();
    return ended ? 1 : 0;
}

int CredRequestFarlink::GetConnInfo(const std::string &alias, Json::Value &info,
                                    const void * /*options*/) {
    const int done = fails(__func__) ? 0 : 1;
    const auto found = credentialLibrary().relay.find(alias);
    if (found == credentialLibrary().relay.end()) {
        return 0;
    }
    info = found->second;
    return done;
}

} // namespace OVRA
