// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"

#include "support/local_node.h"
#include "support/test_certificate.h"

#include <ovrabase/address.h>
#include <ovradrcore/json.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/wire_form.h>

#include <curl/curl.h>
#include <openssl/pem.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <stdexcept>

namespace OvraTest {

namespace {

void require(bool ok, const char *what) {
    if (!ok) {
        throw std::runtime_error(what);
    }
}

struct CloseFile {
    void operator()(FILE *file) const { std::fclose(file); }
};

void writeTlsFiles() {
    const TestCertificate made("IP:127.0.0.1");
    const std::unique_ptr<FILE, CloseFile> key(std::fopen(OvraPlatform::kTlsKeyFile, "w"));
    const std::unique_ptr<FILE, CloseFile> certificate(
        std::fopen(OvraPlatform::kTlsCertificateFile, "w"));
    require(key && certificate && fchmod(fileno(key.get()), 0600) == 0 &&
                PEM_write_PrivateKey(key.get(), made.key(), nullptr, nullptr, 0, nullptr,
                                     nullptr) == 1 &&
                PEM_write_X509(certificate.get(), made.certificate()) == 1,
            "the TLS files cannot be written");
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
    writeTlsFiles();
    require(OvraPlatform::SealKeyPair::loadOrCreate(OvraPlatform::kSealKeyFile).has_value(),
            "no sealing key");
}

void Appliance::addAccount(const std::string &name, bool administrator) {
    OvraPlatform::AccountStore accounts;
    require(accounts.add(name, kPassword, administrator), accounts.error().c_str());
}

std::string Appliance::session(const std::string &user, int timeout) {
    OvraPlatform::SessionRequest request;
    request.user = user;
    request.timeout = timeout;
    request.keepOthers = true;
    return OvraPlatform::SessionStore().create(request).value_or("");
}

void Appliance::SetUp() {
    provision();
    restart({});
}

void Appliance::restart(const OvraService::HttpLimits &limits, std::size_t testFiles) {
    daemon_.reset();
    Ovradrd::Settings settings;
    settings.addresses = {"127.0.0.1"};
    settings.limits = limits;
    settings.testFiles = testFiles;
    daemon_ = std::make_unique<Ovradrd::Daemon>(settings);
    const auto started = daemon_->start();
    ASSERT_TRUE(started) << started.error().text;
}

Reply Appliance::http(const HttpCall &call) const {
    const std::unique_ptr<CURL, void (*)(CURL *)> curl(curl_easy_init(), curl_easy_cleanup);
    curl_slist *headers = curl_slist_append(nullptr, ("Content-Type: " + call.type).c_str());
    headers = curl_slist_append(headers, "Expect:");
    if (call.chunked) {
        headers = curl_slist_append(headers, "Transfer-Encoding: chunked");
    }
    const std::string url = (call.tls ? "https://127.0.0.1:" : "http://127.0.0.1:") +
                            std::to_string(port(call.tls)) + call.path;
    Reply reply;
    curl_easy_setopt(curl.get(), CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl.get(), CURLOPT_NOPROXY, "*");
    curl_easy_setopt(curl.get(), CURLOPT_SSL_VERIFYPEER, 0L);
    curl_easy_setopt(curl.get(), CURLOPT_SSL_VERIFYHOST, 0L);
    curl_easy_setopt(curl.get(), CURLOPT_TIMEOUT, 30L);
    curl_easy_setopt(curl.get(), CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(curl.get(), CURLOPT_HTTPHEADER, headers);
    curl_easy_setopt(curl.get(), CURLOPT_WRITEFUNCTION, takeBody);
    curl_easy_setopt(curl.get(), CURLOPT_WRITEDATA, &reply.text);
    if (call.method != "GET") {
        curl_easy_setopt(curl.get(), CURLOPT_POSTFIELDSIZE_LARGE,
                         static_cast<curl_off_t>(call.body.size()));
        curl_easy_setopt(curl.get(), CURLOPT_POSTFIELDS, call.body.c_str());
        curl_easy_setopt(curl.get(), CURLOPT_CUSTOMREQUEST, call.method.c_str());
    }
    if (curl_easy_perform(curl.get()) == CURLE_OK) {
        curl_easy_getinfo(curl.get(), CURLINFO_RESPONSE_CODE, &reply.status);
    }
    curl_slist_free_all(headers);
    (void)OvraDRCore::fromString(reply.document, reply.text); // not every answer is a document
    return reply;
}

Reply Appliance::call(const std::string &api, int version, const std::string &method,
                      const Json::Value &params, const std::string &sid, bool tls) const {
    OvraPlatform::WireCall wire;
    wire.api = api;
    wire.version = version;
    wire.method = method;
    wire.params = params;
    wire.sid = sid;
    return http({.body = OvraPlatform::encodeForm(wire).value(), .tls = tls});
}

Reply Appliance::login(const std::string &account, const std::string &password,
                       const std::string &code) const {
    Json::Value params;
    params["account"] = account;
    params["passwd"] = password;
    if (!code.empty()) {
        params["otp_code"] = code;
    }
    return call("OVRA.Core.Auth", 1, "login", params);
}

RawConnection::RawConnection(int port)
    : fd_(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const auto server = OvraBase::parseAddress("127.0.0.1", port);
    if (connect(fd(), server->get(), server->size) != 0) {
        fd_.reset();
    }
}

bool RawConnection::isOpen() const {
    char byte = 0;
    return recv(fd(), &byte, 1, MSG_PEEK | MSG_DONTWAIT) < 0 && errno == EAGAIN;
}

bool RawConnection::send(const std::string &bytes) const {
    return ::send(fd(), bytes.data(), bytes.size(), MSG_NOSIGNAL) ==
           static_cast<ssize_t>(bytes.size());
}

bool RawConnection::drain(std::chrono::milliseconds time, std::string &all) const {
    const auto end = std::chrono::steady_clock::now() + time;
    for (;;) {
        const auto left =
            std::chrono::ceil<std::chrono::milliseconds>(end - std::chrono::steady_clock::now());
        pollfd waiting{fd(), POLLIN, 0};
        char part[4096];
        if (left.count() <= 0 || poll(&waiting, 1, static_cast<int>(left.count())) <= 0) {
            return false;
        }
        const ssize_t got = recv(fd(), part, sizeof(part), 0);
        if (got <= 0) {
            return true;
        }
        all.append(part, static_cast<std::size_t>(got));
    }
}

std::string RawConnection::readAll(std::chrono::milliseconds time) const {
    std::string all;
    drain(time, all);
    return all;
}

bool RawConnection::closesWithin(std::chrono::milliseconds time) const {
    std::string all;
    return drain(time, all);
}

} // namespace OvraTest
