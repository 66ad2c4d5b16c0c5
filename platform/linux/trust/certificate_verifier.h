// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/endpoint.h"
#include "ovraplatform/trust_store.h"

#include <openssl/ssl.h>
#include <openssl/x509.h>

#include <string>

namespace OvraPlatform {

/// "SHA256:..." of the certificate's public key (its SubjectPublicKeyInfo); "" if there is none.
/// The key and not the certificate, so that a certificate that is renewed on its key stays trusted.
std::string fingerprintOf(const X509 *certificate);

/// Verifies the certificate of one endpoint in the TLS handshake.
///
/// What the system's store accepts for the host is accepted, whatever is pinned. Otherwise the key
/// must be the pinned one. A key seen for the first time passes the handshake, and must be pinned
/// (pinNewKey) before anything is sent: only after the handshake has the peer proved that it holds
/// the key.
class CertificateVerifier {
public:
    enum class Verdict {
        kNotAsked,    ///< no certificate was shown yet
        kSystem,      ///< the system's store accepts it
        kPinned,      ///< it has the pinned key
        kNew,         ///< no key is pinned yet
        kChanged,     ///< another key is pinned
        kUnavailable, ///< the pinned keys cannot be read
    };

    /// \param observe  every certificate passes; the verdict is only told
    CertificateVerifier(Endpoint endpoint, bool observe);

    /// Makes the connections of the context use this verifier, which must outlive them.
    void install(SSL_CTX *context);
    /// Pins a key that is new; false if that failed, and then the verdict says why.
    [[nodiscard]] bool pinNewKey();

    Verdict verdict() const { return verdict_; }
    /// Of the key verified last.
    const std::string &fingerprint() const { return fingerprint_; }

private:
    static int verify(X509_STORE_CTX *chain, void *self);
    Verdict verdictOn(X509_STORE_CTX *chain);
    [[nodiscard]] bool systemAccepts(X509_STORE_CTX *chain) const;

    Endpoint endpoint_;
    bool observe_;
    Verdict verdict_ = Verdict::kNotAsked;
    std::string fingerprint_;
};

} // namespace OvraPlatform
