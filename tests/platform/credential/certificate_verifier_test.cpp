// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "support/test_certificate.h"
#include "trust/certificate_verifier.h"
#include "trust/peer_keys.h"

#include <ovrabase/encoding.h>

#include <gtest/gtest.h>
#include <openssl/ssl.h>

#include <memory>

namespace {

using namespace OvraPlatform;

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
    using Mode = CertificateVerifier::Mode;

    /// What the handshake ends with, and what is then remembered.
    CredError judge(const std::string &host, const OvraTest::TestCertificate &server,
                    const OvraTest::TestCertificate *system, Mode mode = Mode::kVerify) {
        CertificateVerifier each(Endpoint::make("https", host, 5001).value(), mode);
        const bool done = shakeHands(each, server, system);
        EXPECT_EQ(done, each.error() == CredError::kNone);
        return done && mode != Mode::kObserve && !each.settle() ? CredError::kInternal
                                                                : each.error();
    }
    static std::string known(const std::string &endpoint) {
        return TrustStore().find(endpoint).value_or(TrustStore::Entry()).value;
    }

    OvraTest::TestCertificate server_{"DNS:nas.example,IP:192.0.2.7,DNS:nas.farlink.alt"};
    OvraTest::TestCertificate other_{"DNS:nas.example"};
    const std::string key_ = fingerprintOf(server_.certificate());
};

TEST_F(JudgeScene, AcceptsWhatTheSystemAcceptsForThatNameOrAddressAndRequiresItFromThenOn) {
    EXPECT_TRUE(TrustStore().create());
    for (const char *host : {"nas.example", "192.0.2.7"}) {
        const std::string endpoint = "https://" + std::string(host) + ":5001";
        EXPECT_EQ(judge(host, server_, &server_), CredError::kNone);
        EXPECT_EQ(known(endpoint), TrustStore::kSystem);
        EXPECT_EQ(judge(host, server_, &server_), CredError::kNone);
        // Self-signed now, or expired, or the store cannot be read: the system does not accept it.
        EXPECT_EQ(judge(host, server_, nullptr), CredError::kCertificateChanged);
        EXPECT_EQ(judge(host, other_, nullptr, Mode::kFirstContact),
                  CredError::kCertificateChanged);
        EXPECT_EQ(known(endpoint), TrustStore::kSystem);
    }
    const OvraTest::TestCertificate expired("DNS:nas.example", -60);
    EXPECT_EQ(judge("nas.example", expired, &expired), CredError::kCertificateChanged);
    for (const char *host : {"other.example", "192.0.2.8"}) {
        EXPECT_EQ(judge(host, server_, &server_), CredError::kNotTrusted) << host;
    }
    EXPECT_TRUE(TrustStore().forget("https://nas.example:5001"));
    EXPECT_EQ(judge("nas.example", server_, &server_), CredError::kNotTrusted);
}

TEST_F(JudgeScene, ThatSomebodyPinnedAKeyMeanwhileIsAnErrorOnlyIfItIsAnother) {
    EXPECT_TRUE(TrustStore().create());
    for (const OvraTest::TestCertificate *pinned : {&server_, &other_}) {
        CertificateVerifier each(Endpoint::make("https", "nas.example", 5001).value(),
                                 Mode::kVerify);
        EXPECT_TRUE(shakeHands(each, server_, &server_));
        TrustStore().trust("https://nas.example:5001", fingerprintOf(pinned->certificate()), true);
        EXPECT_EQ(each.settle(), pinned == &server_);
        EXPECT_TRUE(std::filesystem::remove(kKnownEndpointsFile) && TrustStore().create());
    }
}

TEST_F(JudgeScene, AsksForThePinnedKeyWhoeverElseAcceptsTheCertificate) {
    EXPECT_TRUE(TrustStore().create());
    TrustStore().trust("https://nas.example:5001", key_, false);
    EXPECT_EQ(judge("nas.example", server_, nullptr), CredError::kNone);
    EXPECT_EQ(judge("nas.example", other_, &other_), CredError::kCertificateChanged);
    EXPECT_EQ(judge("nas.example", other_, nullptr), CredError::kCertificateChanged);
    EXPECT_EQ(judge("nas.example", other_, nullptr, Mode::kObserve), CredError::kNone);
    // Nobody vouches for an alias, and none is trusted at first contact.
    for (const Mode mode : {Mode::kVerify, Mode::kFirstContact}) {
        EXPECT_EQ(judge("nas.farlink.alt", server_, &server_, mode), CredError::kNotTrusted);
    }
    TrustStore().trust("flk:nas", key_, false);
    EXPECT_EQ(judge("nas.farlink.alt", server_, nullptr), CredError::kNone);
    EXPECT_EQ(judge("nas.farlink.alt", other_, &other_), CredError::kCertificateChanged);
}

TEST_F(JudgeScene, PinsANewKeyAtALogInOrWhenItsPeerNamedItAndWithASoundFile) {
    EXPECT_EQ(judge("nas.example", server_, &server_, Mode::kFirstContact), CredError::kTrustLost);
    EXPECT_TRUE(TrustStore().create());
    EXPECT_EQ(judge("nas.example", server_, nullptr), CredError::kNotTrusted);
    Json::Value call;
    call["conn"]["addr"] = "192.0.2.7";
    call["conn"]["protocol"] = "https";
    call["conn"]["port"] = 5001;
    call["_keys"].append(key_);
    {
        const PeerKeyScope peer(call);
        EXPECT_EQ(judge("192.0.2.7", other_, nullptr), CredError::kNotTrusted) << "another key";
        EXPECT_EQ(judge("nas.example", server_, nullptr), CredError::kNotTrusted) << "not its own";
        EXPECT_EQ(judge("192.0.2.7", server_, nullptr), CredError::kNone);
        EXPECT_EQ(known("https://192.0.2.7:5001"), key_);
        EXPECT_TRUE(TrustStore().forget("https://192.0.2.7:5001"));
        EXPECT_EQ(judge("192.0.2.7", server_, nullptr), CredError::kNotTrusted) << "withdrawn";
    }
    EXPECT_EQ(judge("nas.example", server_, nullptr, Mode::kFirstContact), CredError::kNone);
    EXPECT_EQ(known("https://nas.example:5001"), key_);
    std::filesystem::remove(kKnownEndpointsFile);
    std::filesystem::create_directory(kKnownEndpointsFile);
    EXPECT_EQ(judge("nas.example", server_, &server_), CredError::kTrustUnavailable);
}

} // namespace
