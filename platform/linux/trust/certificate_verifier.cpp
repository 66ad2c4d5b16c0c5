// SPDX-License-Identifier: Apache-2.0
#include "trust/certificate_verifier.h"

#include <ovrabase/encoding.h>
#include <ovradrcore/log.h>
#include <ovradrcore/no_fork.h>

#include <openssl/x509_vfy.h>

#include <exception>
#include <memory>
#include <utility>

namespace OvraPlatform {

namespace {

struct FreeOpenSsl {
    void operator()(unsigned char *bytes) const { OPENSSL_free(bytes); }
};

CertificateVerifier::Verdict verdictOf(TrustVerdict trust) {
    switch (trust) {
    case TrustVerdict::kTrusted:
        return CertificateVerifier::Verdict::kPinned;
    case TrustVerdict::kUnknown:
        return CertificateVerifier::Verdict::kNew;
    case TrustVerdict::kDifferent:
        return CertificateVerifier::Verdict::kChanged;
    case TrustVerdict::kUnavailable:
        break;
    }
    return CertificateVerifier::Verdict::kUnavailable;
}

} // namespace

std::string fingerprintOf(const X509 *certificate) {
    const X509_PUBKEY *key = certificate == nullptr ? nullptr : X509_get_X509_PUBKEY(certificate);
    unsigned char *encoded = nullptr;
    const int size = key == nullptr ? 0 : i2d_X509_PUBKEY(key, &encoded);
    const std::unique_ptr<unsigned char, FreeOpenSsl> owner(encoded);
    if (size <= 0 || !OvraBase::sodiumReady()) {
        return {};
    }
    return OvraBase::fingerprintOf(encoded, static_cast<std::size_t>(size));
}

CertificateVerifier::CertificateVerifier(Endpoint endpoint, bool observe)
    : endpoint_(std::move(endpoint))
    , observe_(observe) {}

void CertificateVerifier::install(SSL_CTX *context) {
    SSL_CTX_set_options(context, SSL_OP_NO_RENEGOTIATION);
    SSL_CTX_set_verify(context, SSL_VERIFY_PEER, nullptr);
    SSL_CTX_set_cert_verify_callback(context, &CertificateVerifier::verify, this);
}

int CertificateVerifier::verify(X509_STORE_CTX *chain, void *self) {
    auto *verifier = static_cast<CertificateVerifier *>(self);
    verifier->verdict_ = Verdict::kUnavailable;
    try {
        verifier->verdict_ = verifier->verdictOn(chain);
    } catch (const std::exception &error) {
        OVRA_ERR("A certificate cannot be judged: [%s]", error.what());
    }
    const bool trusted = verifier->verdict_ == Verdict::kSystem ||
                         verifier->verdict_ == Verdict::kPinned ||
                         verifier->verdict_ == Verdict::kNew;
    if (trusted || verifier->observe_) {
        X509_STORE_CTX_set_error(chain, X509_V_OK);
        return 1;
    }
    X509_STORE_CTX_set_error(chain, X509_V_ERR_APPLICATION_VERIFICATION);
    return 0;
}

CertificateVerifier::Verdict CertificateVerifier::verdictOn(X509_STORE_CTX *chain) {
    fingerprint_ = fingerprintOf(X509_STORE_CTX_get0_cert(chain));
    if (fingerprint_.empty()) {
        return Verdict::kUnavailable;
    }
    if (systemAccepts(chain)) {
        return Verdict::kSystem;
    }
    const TrustVerdict trust = TrustStore().lookup(endpoint_.key(), fingerprint_);
    if (trust == TrustVerdict::kDifferent && !observe_) {
        OVRA_ERR("The key [%s] of [%s] is not the one trusted for it: find out why it changed, "
                 "then forget the old one",
                 fingerprint_.c_str(), endpoint_.key().c_str());
    }
    return verdictOf(trust);
}

bool CertificateVerifier::systemAccepts(X509_STORE_CTX *chain) const {
    X509_VERIFY_PARAM *wanted = X509_STORE_CTX_get0_param(chain);
    const std::string &host = endpoint_.host();
    // The certificate must list an address as an address, a name as a name.
    const bool set = X509_VERIFY_PARAM_set1_ip_asc(wanted, host.c_str()) == 1 ||
                     X509_VERIFY_PARAM_set1_host(wanted, host.c_str(), host.size()) == 1;
    return set && X509_verify_cert(chain) == 1;
}

bool CertificateVerifier::pinNewKey() {
    if (verdict_ != Verdict::kNew) {
        return true;
    }
    const OvraDRCore::NoFork::Pause forksPass; // it may wait for the file
    verdict_ = verdictOf(TrustStore().pin(endpoint_.key(), fingerprint_));
    return verdict_ == Verdict::kPinned;
}

} // namespace OvraPlatform
