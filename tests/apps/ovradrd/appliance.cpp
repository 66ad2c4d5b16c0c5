// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"

#include "service/certificate.h"
#include "support/local_node.h"

#include <ovradrcore/json.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/wire_form.h>
#include <ovrawebapi/api_runner.h>

#include <curl/curl.h>

#include <stdexcept>

namespace OvraTest {

namespace {

void require(bool ok, const char *what) {
    if (!ok) {
        throw std::runtime_error(what);
    }
}

std::size_t takeBody(const char *data, std::size_t size, std::size_t count, void *text) {
    static_cast<std::string *>(text)->append(data, size * count);
    return size * count;
}

} // namespace

int Reply::code() const {
    if (!document.isObject() || !document["success"].isBool()) {
        return -1;
    }
    return document["success"].asBool() ? 0 : document["error"]["code"].asInt();
}

Json::Value json(const std::string &text) {
    Json::Value value;
    require(OvraDRCore::fromString(value, text), text.c_str());
    return value;
}

void Appliance::provision() {
    provisionNode();
    require(OvraPlatform::ensureStateDir(), "no state folder");
    require(OvraService::createTlsKey(OvraPlatform::kTlsKeyFile) &&
                OvraService::createCertificate(OvraPlatform::kTlsCertificateFile,
                                               OvraPlatform::kTlsKeyFile, {"localhost", {}}),
            "no TLS files");
    require(OvraPlatform::SealKeyPair::loadOrCreate(OvraPlatform::kSealKeyFile).has_value(),
            "no sealing key");
}

void Appliance::addAccount(const std::string &name, bool administrator) {
    OvraPlatform::AccountStore accounts;
    require(accounts.add(name, kPassword,
                         administrator ? OvraPlatform::Role::kAdministrator
                                       : OvraPlatform::Role::kUser),
            accounts.error().c_str());
}

std::string Appliance::session(const std::string &user, int timeout) {
    return OvraPlatform::SessionStore()
        .create({.user = user, .timeout = timeout, .keepOthers = true})
        .value_or("");
}

void Appliance::SetUp() {
    provision();
    restart({});
}

void Appliance::restart(const OvraService::HttpLimits &limits, std::size_t testFiles) {
    daemon_.reset();
    daemon_ = std::make_unique<Ovradrd::Daemon>(
        Ovradrd::Settings{.addresses = {"127.0.0.1"}, .limits = limits, .testFiles = testFiles});
    const auto started = daemon_->start();
    ASSERT_TRUE(started) << started.error().text;
}

HttpClient::HttpClient(int https, int http)
    : https_(https)
    , http_(http)
    , curl_(curl_easy_init(), curl_easy_cleanup) {}

Reply HttpClient::http(const HttpCall &call) const {
    CURL *const curl = curl_.get();
    curl_easy_reset(curl);
    curl_slist *headers = curl_slist_append(nullptr, ("Content-Type: " + call.type).c_str());
    headers = curl_slist_append(headers, "Expect:");
    if (call.chunked) {
        headers = curl_slist_append(headers, "Transfer-Encoding: chunked");
    }
    const std::string url = (call.tls ? "https://127.0.0.1:" : "http://127.0.0.1:") +
                            std::to_string(call.tls ? https_ : http_) + call.path;
    Reply reply;
    curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl, CURLOPT_NOPROXY, "*");
    curl_easy_setopt(curl, CURLOPT_SSL_VERIFYPEER, 0L);
    curl_easy_setopt(curl, CURLOPT_SSL_VERIFYHOST, 0L);
    curl_easy_setopt(curl, CURLOPT_TIMEOUT, 100L);
    curl_easy_setopt(curl, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(curl, CURLOPT_HTTPHEADER, headers);
    curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, takeBody);
    curl_easy_setopt(curl, CURLOPT_WRITEDATA, &reply.text);
    if (!call.from.empty()) {
        curl_easy_setopt(curl, CURLOPT_INTERFACE, call.from.c_str());
    }
    if (call.method != "GET") {
        curl_easy_setopt(curl, CURLOPT_POSTFIELDSIZE_LARGE,
                         static_cast<curl_off_t>(call.body.size()));
        curl_easy_setopt(curl, CURLOPT_POSTFIELDS, call.body.c_str());
        curl_easy_setopt(curl, CURLOPT_CUSTOMREQUEST, call.method.c_str());
    }
    if (curl_easy_perform(curl) == CURLE_OK) {
        curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &reply.status);
    }
    curl_slist_free_all(headers);
    (void)OvraDRCore::fromString(reply.document, reply.text); // not every answer is a document
    return reply;
}

Reply HttpClient::call(const std::string &api, int version, const std::string &method,
                       const Json::Value &params, const std::string &sid, bool tls) const {
    const OvraPlatform::WireCall wire{{api, version, method, params}, sid, ""};
    return http({.body = OvraPlatform::encodeForm(wire).value(), .tls = tls});
}

Reply HttpClient::login(const std::string &account, const std::string &password,
                        const std::string &code, const std::string &from) const {
    Json::Value params;
    params["account"] = account;
    params["passwd"] = password;
    if (!code.empty()) {
        params["otp_code"] = code;
    }
    const OvraPlatform::WireCall wire{{"OVRA.Core.Auth", 1, "login", params}, "", ""};
    return http({.body = OvraPlatform::encodeForm(wire).value(), .from = from});
}

Json::Value Appliance::callHere(const char *api, int version, const char *method,
                                const Json::Value &params) {
    Json::Value reply;
    OVRA::APIRunner().Exec(reply, api, version, method, params, "admin");
    return reply;
}

} // namespace OvraTest
