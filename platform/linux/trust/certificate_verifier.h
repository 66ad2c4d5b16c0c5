// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/endpoint.h"
#include "ovraplatform/cred_errors.h"
#include "ovraplatform/trust_store.h"

#include <openssl/ssl.h>
#include <openssl/x509.h>

#include <string>

namespace OvraPlatform {

/// "SHA256:..." of the certificate's public key (its SubjectPublicKeyInfo); "" if there is none.
/// The key and not the certificate, so that a certificate that is renewed on its key stays trusted.
std::string fingerprintOf(const X509 *certificate);

/// What requests end with under a verdict that is not kTrusted.
CredError errorOfTrust(TrustVerdict verdict);
/// Logs why a key is not trusted, and what to do.
void logDistrust(const Endpoint &endpoint, const std::string &fingerprint, TrustVerdict verdict);

/// Verifies the certificate of one endpoint in the TLS handshake.
///
/// Where a key is pinned, it must be that one, whoever signed the certificate. Otherwise, except
/// for an alias, what the system's store accepts for the host is accepted, and from then on that is
/// required. Any other key of an unknown endpoint is refused, unless this is the first contact or
/// the peer itself named it: then it passes the handshake, and must be pinned (settle) before
/// anything is sent, because only after the handshake has the peer proved that it holds the key.
class CertificateVerifier {
public:
    enum class Mode {
        kVerify,
        kFirstContact, ///< until the first connection is settled
        kObserve,      ///< every certificate passes; the verdict is only told
    };

    CertificateVerifier(Endpoint endpoint, Mode mode);

    /// Makes the connections of the context use this verifier, which must outlive them.
    void install(SSL_CTX *context);
    /// Keeps what this contact taught; false if a new key cannot be pinned, and then error() says
    /// why. Ends the first contact.
    [[nodiscard]] bool settle();

    /// kNone while nothing is against the key, or none was shown yet.
    CredError error() const { return error_; }
    /// Whether the system's store accepts the certificate verified last; told where it counts, and
    /// to observers.
    bool isAcceptedBySystem() const { return acceptedBySystem_; }
    /// Of the key verified last.
    const std::string &fingerprint() const { return fingerprint_; }

private:
    /// What settle() has to do.
    enum class Lesson { kNone, kPin, kVouch };

    static int verify(X509_STORE_CTX *chain, void *self);
    CredError judge(X509_STORE_CTX *chain);
    [[nodiscard]] bool systemAccepts(X509_STORE_CTX *chain) const;

    Endpoint endpoint_;
    Mode mode_;
    Lesson lesson_ = Lesson::kNone;
    CredError error_ = CredError::kNone;
    bool acceptedBySystem_ = false;
    std::string fingerprint_;
};

} // namespace OvraPlatform
