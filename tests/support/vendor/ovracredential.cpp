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

/// Null if it cannot be reached.
Remote *findRemote(const OVRACred &cred) {
    auto &remotes = credentialLibrary.remotes;
    const auto found =
        remotes.find(cred.protocol + "://" + cred.host + ":" + std::to_string(cred.port));
    return found != remotes.end() && found->second.reachable ? &found->second : nullptr;
}

Json::Value refusal(int code) {
    Json::Value document;
    document["success"] = false;
    document["error"]["code"] = code;
    return document;
}

/// \param error  receives the number, if the operation has to fail
bool fails(const char *operation, int *error = nullptr) {
    const auto &fault = credentialLibrary.fault;
    const std::optional<int> number = fault ? fault(operation) : std::nullopt;
    if (number && error != nullptr) {
        *error = *number;
    }
    return number.has_value();
}

} // namespace

extern "C" {
OVRACred *OVRACredAlloc() {
    if (fails(__func__)) {
        return nullptr;
    }
    ++credentialLibrary.credentials;
    return new OVRACred;
}
void OVRACredFree(OVRACred *cred) {
    --credentialLibrary.credentials;
    delete cred;
}
OVRACredSess *OVRACredSessAlloc() {
    if (fails(__func__)) {
        return nullptr;
    }
    ++credentialLibrary.sessions;
    return new OVRACredSess;
}
void OVRACredSessFree(OVRACredSess *sess) {
    --credentialLibrary.sessions;
    delete sess;
}
int OVRACredItemSetProtocol(OVRACred *cred, const char *protocol) {
    return fails(__func__) || (cred->protocol = protocol).empty() ? -1 : 0;
}
int OVRACredItemSetHost(OVRACred *cred, const char *host) {
    return fails(__func__) || (cred->host = host).empty() ? -1 : 0;
}
int OVRACredItemSetPort(OVRACred *cred, int port) {
    cred->port = port;
    return fails(__func__) ? -1 : 0;
}
int OVRACredItemSetRemoteAccount(OVRACred *cred, const char *account) {
    return fails(__func__) || (cred->account = account).empty() ? -1 : 0;
}
int OVRACredItemSetRemotePasswd(OVRACred *cred, const char *passwd) {
    return fails(__func__) || (cred->password = passwd).empty() ? -1 : 0;
}
int OVRACredSessItemSetAccessToken(OVRACredSess *sess, const char *token) {
    return fails(__func__) || (sess->token = token).empty() ? -1 : 0;
}
}

namespace OVRA {

struct CredRequest::Impl {
    Remote *remote = nullptr; ///< null: cannot be reached
    Call call;
    std::string response;
    int error = 0;
};

CredRequest::CredRequest()
    : impl_(std::make_unique<Impl>()) {
    ++credentialLibrary.requests;
}

CredRequest::~CredRequest() {
    --credentialLibrary.requests;
}

int CredRequest::SetURL(const std::string &protocol, const std::string &address, int port,
                        const std::string &path) {
    impl_->remote = findRemote({protocol, address, "", "", port});
    return fails(__func__) || path != "webapi/query.cgi" ? 0 : 1;
}

int CredRequest::SetDefaultTimeout(long seconds) {
    return !fails(__func__) && seconds > 0 ? 1 : 0;
}

int CredRequest::SetResponseTimeout(long seconds) {
    impl_->call.timeout = seconds;
    return seconds > 0 ? 1 : 0;
}

int CredRequest::SetEncryptMode(int mode) {
    impl_->call.sealed = mode == 2;
    return 1;
}

int CredRequest::SetUploadFile(const std::string &path, const std::string &name) {
    impl_->call.uploads.push_back(path + " as " + name);
    return 1;
}

int CredRequest::CreateWebAPIRequest(CredRequest &req, OVRACred *cred, OVRACredSess *sess,
                                     const std::string &api, int version, const std::string &method,
                                     const Json::Value &params) {
    req.impl_->remote = findRemote(*cred);
    req.impl_->call = {sess != nullptr ? sess->token : "", api, method, version, params};
    return fails(__func__, &req.impl_->error) ? 0 : 1;
}

int CredRequest::Process(bool reuse, int mode) {
    Remote *const remote = impl_->remote;
    impl_->error = remote != nullptr ? 0 : kCannotConnect;
    if (fails(mode == 2 ? "probe" : __func__, &impl_->error)) {
        return 0;
    }
    impl_->call.reused = reuse;
    if (remote != nullptr && mode != 2) {
        remote->calls.push_back(impl_->call);
        const bool known = remote->sessions.count(impl_->call.session) == 1;
        impl_->response = Json::writeString(Json::StreamWriterBuilder(),
                                            known ? remote->answer(impl_->call) : refusal(119));
    }
    return remote != nullptr ? 1 : 0;
}

std::string CredRequest::GetResponse() const {
    return impl_->response;
}

int CredRequest::GetError() const {
    return impl_->error;
}

int CredRequestUtil::LoginWithOTP(OVRACred *cred, const std::string &otp, OVRACredSess *sess,
                                  Json::Value *out) {
    Remote *const remote = findRemote(*cred);
    const int done = fails(__func__) || remote == nullptr ? 0 : 1;
    if (remote == nullptr || cred->account + "/" + cred->password + "/" + otp != remote->login) {
        *out = refusal(remote != nullptr ? remote->refusal : 100);
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
    Remote *const remote = findRemote(*cred);
    if (remote != nullptr) {
        ++remote->logouts;
    }
    return remote != nullptr && remote->sessions.erase(sess->token) == 1 ? 1 : 0;
}

int CredRequestFarlink::GetConnInfo(const std::string &alias, Json::Value &info,
                                    const void * /*options*/) {
    const int done = fails(__func__) ? 0 : 1;
    const auto found = credentialLibrary.relay.find(alias);
    if (found == credentialLibrary.relay.end()) {
        return 0;
    }
    info = found->second;
    return done;
}

} // namespace OVRA
