// SPDX-License-Identifier: Apache-2.0
#include "trust/certificate_verifier.h"

#include "trust/peer_keys.h"

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

CredError errorOfTrust(TrustVerdict verdict) {
    switch (verdict) {
    case TrustVerdict::kTrusted:
        return CredError::kNone;
    case TrustVerdict::kDifferent:
    case TrustVerdict::kVouched: // the present key is not what was vouched for
        return CredError::kCertificateChanged;
    case TrustVerdict::kUnknown:
    case TrustVerdict::kForgotten:
        return CredError::kNotTrusted;
    case TrustVerdict::kLost:
        return CredError::kTrustLost;
    case TrustVerdict::kShortage:
        return CredError::kOutOfMemory;
    case TrustVerdict::kUnavailable:
        break;
    }
    return CredError::kTrustUnavailable;
}

void logDistrust(const Endpoint &endpoint, const std::string &fingerprint, TrustVerdict verdict) {
    OVRA_ERR("The key [%s] of [%s]: %s", fingerprint.c_str(), endpoint.trustKey().c_str(),
             credErrorText(static_cast<int>(errorOfTrust(verdict))));
}

CertificateVerifier::CertificateVerifier(Endpoint endpoint, Mode mode)
    : endpoint_(std::move(endpoint))
    , mode_(mode) {}

void CertificateVerifier::install(SSL_CTX *context) {
    SSL_CTX_set_options(context, SSL_OP_NO_RENEGOTIATION);
    SSL_CTX_set_verify(context, SSL_VERIFY_PEER, nullptr);
    SSL_CTX_set_cert_verify_callback(context, &CertificateVerifier::verify, this);
}

int CertificateVerifier::verify(X509_STORE_CTX *chain, void *self) {
    auto *verifier = static_cast<CertificateVerifier *>(self);
    verifier->error_ = CredError::kTrustUnavailable;
    try {
        verifier->error_ = verifier->judge(chain);
    } catch (const std::exception &error) {
        OVRA_ERR("A certificate cannot be judged: [%s]", error.what());
    }
    if (verifier->error_ == CredError::kNone) {
        X509_STORE_CTX_set_error(chain, X509_V_OK);
        return 1;
    }
    X509_STORE_CTX_set_error(chain, X509_V_ERR_APPLICATION_VERIFICATION);
    return 0;
}

CredError CertificateVerifier::judge(X509_STORE_CTX *chain) {
    lesson_ = Lesson::kNone;
    fingerprint_ = fingerprintOf(X509_STORE_CTX_get0_cert(chain));
    if (fingerprint_.empty()) {
        return CredError::kTrustUnavailable;
    }
    const TrustVerdict known = TrustStore().lookup(endpoint_.trustKey(), fingerprint_);
    const bool systemCounts = known == TrustVerdict::kUnknown || known == TrustVerdict::kVouched;
    acceptedBySystem_ = (systemCounts || mode_ == Mode::kObserve) && systemAccepts(chain);
    if (mode_ == Mode::kObserve || known == TrustVerdict::kTrusted) {
        return CredError::kNone;
    }
    if (systemCounts && acceptedBySystem_) {
        lesson_ = known == TrustVerdict::kUnknown ? Lesson::kVouch : Lesson::kNone;
        return CredError::kNone;
    }
    // Of an alias the relay chooses who answers, so that the first one may be anybody.
    const bool firstContact = mode_ == Mode::kFirstContact && endpoint_.alias().empty();
    if (known == TrustVerdict::kUnknown &&
        (firstContact || isNamedByPeer(endpoint_, fingerprint_))) {
        lesson_ = Lesson::kPin;
        return CredError::kNone;
    }
    logDistrust(endpoint_, fingerprint_, known);
    return errorOfTrust(known);
}

/// A certificate for the host of an alias would say nothing: nobody else can vouch for a name of
/// our own.
bool CertificateVerifier::systemAccepts(X509_STORE_CTX *chain) const {
    X509_VERIFY_PARAM *wanted = X509_STORE_CTX_get0_param(chain);
    const std::string &host = endpoint_.host();
    // The certificate must list an address as an address, a name as a name.
    const bool set = X509_VERIFY_PARAM_set1_ip_asc(wanted, host.c_str()) == 1 ||
                     X509_VERIFY_PARAM_set1_host(wanted, host.c_str(), host.size()) == 1;
    return endpoint_.alias().empty() && set && X509_verify_cert(chain) == 1;
}

bool CertificateVerifier::settle() {
    const Lesson lesson = std::exchange(lesson_, Lesson::kNone);
    mode_ = mode_ == Mode::kFirstContact ? Mode::kVerify : mode_;
    if (lesson == Lesson::kNone) {
        return true;
    }
    const OvraDRCore::NoFork::Pause forksPass; // it may wait for the file
    if (lesson == Lesson::kVouch) {
        TrustStore store;
        TrustVerdict noted = store.vouch(endpoint_.trustKey());
        if (noted ==
            TrustVerdict::kDifferent) { // somebody pinned a key meanwhile, perhaps this one
            noted = store.lookup(endpoint_.trustKey(), fingerprint_);
        }
        // Without the note the certificate is good all the same.
        const bool isGood = noted == TrustVerdict::kVouched ||
                            noted == TrustVerdict::kUnavailable || noted == TrustVerdict::kShortage;
        error_ = isGood ? CredError::kNone : errorOfTrust(noted);
    } else {
        error_ = errorOfTrust(TrustStore().pin(endpoint_.trustKey(), fingerprint_));
    }
    return error_ == CredError::kNone;
}

} // namespace OvraPlatform
