// SPDX-License-Identifier: Apache-2.0
#include "support/test_certificate.h"

#include <openssl/x509v3.h>

#include <stdexcept>

namespace OvraTest {

namespace {

constexpr long kOneHour = 60L * 60;

void require(bool ok) {
    if (!ok) {
        throw std::runtime_error("OpenSSL cannot make a test certificate");
    }
}

} // namespace

TestCertificate::TestCertificate(const std::string &names, long seconds)
    : key_(EVP_PKEY_Q_keygen(nullptr, nullptr, "EC", "P-256"), EVP_PKEY_free)
    , certificate_(X509_new(), X509_free) {
    require(key_ && certificate_);
    X509 *made = certificate_.get();
    X509_NAME *name = X509_get_subject_name(made);
    const auto *commonName = reinterpret_cast<const unsigned char *>("test");
    require(X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_ASC, commonName, -1, -1, 0) == 1);
    require(X509_set_version(made, X509_VERSION_3) == 1 && X509_set_issuer_name(made, name) == 1 &&
            ASN1_INTEGER_set(X509_get_serialNumber(made), 1) == 1 &&
            X509_gmtime_adj(X509_getm_notBefore(made), -kOneHour) != nullptr &&
            X509_gmtime_adj(X509_getm_notAfter(made), seconds) != nullptr &&
            X509_set_pubkey(made, key_.get()) == 1);
    X509_EXTENSION *extension =
        X509V3_EXT_conf_nid(nullptr, nullptr, NID_subject_alt_name, names.c_str());
    require(extension != nullptr);
    const bool added = X509_add_ext(made, extension, -1) == 1;
    X509_EXTENSION_free(extension);
    require(added && X509_sign(made, key_.get(), EVP_sha256()) > 0);
}

} // namespace OvraTest
