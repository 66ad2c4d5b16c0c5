// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "support/test_certificate.h"
#include "trust/certificate_verifier.h"

#include <ovrabase/encoding.h>

#include <gtest/gtest.h>
#include <openssl/ssl.h>

#include <memory>

namespace {

using namespace OvraPlatform;
using Verdict = CertificateVerifier::Verdict;

struct Free {
    void operator()(SSL_CTX *context) const { SSL_CTX_free(context); }
    void operator()(SSL *ssl) const { SSL_free(ssl); }
};

/// Does a handshake with a server of that certificate, in memory.
/// \param system  the contents of the client's certificate store
bool shakeHands(CertificateVerifier &judge, const OvraTest::TestCertificate &server,
                const OvraTest::TestCertificate *system) {
    const std::unique_ptr<SSL_CTX, Free> serverContext(SSL_CTX_new(TLS_server_method()));
    const std::unique_ptr<SSL_CTX, Free> clientContext(SSL_CTX_new(TLS_client_method()));
    SSL_CTX_use_certificate(serverContext.get(), server.certificate());
    SSL_CTX_use_PrivateKey(serverContext.get(), server.key());
    if (system != nullptr) {
        X509_STORE_add_cert(SSL_CTX_get_cert_store(clientContext.get()), system->certificate());
    }
    judge.install(clientContext.get());
    const std::unique_ptr<SSL, Free> serverEnd(SSL_new(serverContext.get()));
    const std::unique_ptr<SSL, Free> clientEnd(SSL_new(clientContext.get()));
    BIO *one = nullptr;
    BIO *two = nullptr;
    BIO_new_bio_pair(&one, 0, &two, 0);
    SSL_set_bio(serverEnd.get(), one, one);
    SSL_set_bio(clientEnd.get(), two, two);
    SSL_set_accept_state(serverEnd.get());
    SSL_set_connect_state(clientEnd.get());
    for (int i = 0; i < 10 && SSL_do_handshake(clientEnd.get()) != 1; ++i) {
        SSL_do_handshake(serverEnd.get());
    }
    return SSL_is_init_finished(clientEnd.get()) != 0;
}

class JudgeScene : public OvraTest::OwnFiles {
protected:
    static CertificateVerifier judge(const std::string &host = "nas.example",
                                     bool observe = false) {
        return {Endpoint::make("https", host, 5001).value(), observe};
    }

    OvraTest::TestCertificate server_{"DNS:nas.example,IP:192.0.2.7"};
    OvraTest::TestCertificate other_;
};

TEST_F(JudgeScene, AcceptsWhatTheSystemAcceptsForThatNameOrAddressWhateverWasPinned) {
    TrustStore().pin("https://nas.example:5001", fingerprintOf(other_.certificate()));
    for (const auto &[host, verdict] : {std::pair{"nas.example", Verdict::kSystem},
                                        {"192.0.2.7", Verdict::kSystem},
                                        {"other.example", Verdict::kNew},
                                        {"192.0.2.8", Verdict::kNew}}) {
        CertificateVerifier each = judge(host);
        EXPECT_TRUE(shakeHands(each, server_, &server_)) << host;
        EXPECT_EQ(each.verdict(), verdict) << host;
    }
}

TEST_F(JudgeScene, EndsTheHandshakeWithAnotherKeyAndWhenThePinnedKeysCannotBeRead) {
    TrustStore().pin("https://nas.example:5001", fingerprintOf(other_.certificate()));
    CertificateVerifier strict = judge();
    EXPECT_FALSE(shakeHands(strict, server_, nullptr));
    EXPECT_EQ(strict.verdict(), Verdict::kChanged);
    CertificateVerifier observer = judge("nas.example", true);
    EXPECT_TRUE(shakeHands(observer, server_, nullptr));
    EXPECT_EQ(observer.verdict(), Verdict::kChanged);
    std::filesystem::remove(kKnownEndpointsFile);
    std::filesystem::create_directory(kKnownEndpointsFile);
    CertificateVerifier blind = judge();
    EXPECT_FALSE(shakeHands(blind, server_, nullptr));
    EXPECT_EQ(blind.verdict(), Verdict::kUnavailable);
}

} // namespace
