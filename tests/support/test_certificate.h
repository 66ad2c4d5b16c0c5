// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <openssl/evp.h>
#include <openssl/x509.h>

#include <memory>
#include <string>

namespace OvraTest {

/// A fresh P-256 key with a self-signed certificate.
class TestCertificate {
public:
    /// \param names  as OpenSSL writes a subjectAltName, e.g. "DNS:localhost,IP:127.0.0.1"
    /// \param seconds  how long it is valid from now on; negative: it has ended
    explicit TestCertificate(const std::string &names = "DNS:localhost,IP:127.0.0.1",
                             long seconds = 3600);

    EVP_PKEY *key() const { return key_.get(); }
    X509 *certificate() const { return certificate_.get(); }

private:
    std::shared_ptr<EVP_PKEY> key_;
    std::shared_ptr<X509> certificate_;
};

} // namespace OvraTest
