// SPDX-License-Identifier: Apache-2.0
#include "trust/peer_keys.h"

#include "ovraplatform/appliance.h"
#include "ovraplatform/sealed_box.h"
#include "trust/certificate_verifier.h"

#include <ovrabase/encoding.h>
#include <ovrabase/file.h>
#include <ovradrcore/json.h>
#include <ovradrcore/no_fork.h>

#include <openssl/pem.h>

#include <algorithm>
#include <memory>
#include <utility>

namespace OvraPlatform {

namespace {

constexpr char kConn[] = "conn";
constexpr char kSession[] = "session";
constexpr char kKeys[] = "_keys";
/// One for https and one for http.
constexpr Json::ArrayIndex kMostKeys = 2;

thread_local const PeerKeyScope *currentPeer = nullptr;

struct FreeOpenSsl {
    void operator()(BIO *bio) const { BIO_free(bio); }
    void operator()(X509 *certificate) const { X509_free(certificate); }
};

/// "" if there is none.
std::string ownTlsKey() {
    const auto text = OvraBase::readFile(kTlsCertificateFile);
    if (!text) {
        return {};
    }
    const OvraDRCore::NoFork noFork; // a child would wait for the locks of the TLS library
    const std::unique_ptr<BIO, FreeOpenSsl> bio(
        BIO_new_mem_buf(text->data(), static_cast<int>(text->size())));
    const std::unique_ptr<X509, FreeOpenSsl> certificate(
        bio ? PEM_read_bio_X509(bio.get(), nullptr, nullptr, nullptr) : nullptr);
    return fingerprintOf(certificate.get());
}

std::string ownSealKey() {
    const auto keys = SealKeyPair::load(kSealKeyFile);
    return keys ? fingerprintOf(keys->publicKey()) : "";
}

/// The endpoint that a call names; "" for none.
std::string endpointIn(const Json::Value &params) {
    const Json::Value conn = params.isObject() ? params[kConn] : Json::Value();
    const Json::Value port = conn.isObject() ? conn["port"] : Json::Value();
    const auto endpoint =
        Endpoint::of(OvraDRCore::memberString(conn, "protocol"),
                     OvraDRCore::memberString(conn, "addr"), port.isInt() ? port.asInt() : 0);
    return endpoint ? endpoint->trustKey() : "";
}

} // namespace

void nameOwnKeys(Json::Value &params) {
    if (OvraDRCore::memberString(params, kSession).empty() || endpointIn(params).empty() ||
        params.isMember(kKeys)) {
        return;
    }
    Json::Value keys(Json::arrayValue);
    for (const std::string &key : {ownTlsKey(), ownSealKey()}) {
        if (!key.empty()) {
            keys.append(key);
        }
    }
    if (!keys.empty()) {
        params[kKeys] = keys;
    }
}

PeerKeyScope::PeerKeyScope(const Json::Value &params)
    : endpoint_(endpointIn(params))
    , previous_(std::exchange(currentPeer, this)) {
    const Json::Value keys = endpoint_.empty() ? Json::Value() : params[kKeys];
    if (!keys.isArray() || keys.size() > kMostKeys) {
        return;
    }
    for (const Json::Value &key : keys) {
        if (key.isString() && OvraBase::isFingerprint(key.asString())) {
            keys_.push_back(key.asString());
        }
    }
}

PeerKeyScope::~PeerKeyScope() {
    currentPeer = previous_;
}

bool PeerKeyScope::names(const std::string &endpoint, const std::string &fingerprint) const {
    return endpoint_ == endpoint &&
           std::find(keys_.begin(), keys_.end(), fingerprint) != keys_.end();
}

bool isNamedByPeer(const Endpoint &endpoint, const std::string &fingerprint) {
    return currentPeer != nullptr && currentPeer->names(endpoint.trustKey(), fingerprint);
}

} // namespace OvraPlatform
