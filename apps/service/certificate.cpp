// SPDX-License-Identifier: Apache-2.0
#include "service/certificate.h"

#include <ovrabase/address.h>
#include <ovrabase/encoding.h>
#include <ovrabase/file.h>

#include <openssl/bio.h>
#include <openssl/bn.h>
#include <openssl/crypto.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>

#include <algorithm>
#include <array>
#include <memory>

namespace OvraService {

namespace {

using OvraBase::Expected;
using OvraBase::Unexpected;

constexpr int kDays = 3650;
/// The clocks of others may be behind ours.
constexpr long kBackdatedSeconds = 24L * 60 * 60;
constexpr int kSerialBits = 159;           // RFC 5280, 4.1.2.2: positive, at most 20 octets
constexpr std::size_t kMaxCommonName = 64; // RFC 5280, appendix A.1

template <auto Function>
struct FreeWith {
    template <typename T>
    void operator()(T *object) const {
        Function(object);
    }
};
using Bio = std::unique_ptr<BIO, FreeWith<BIO_free>>;
using Key = std::unique_ptr<EVP_PKEY, FreeWith<EVP_PKEY_free>>;
using Certificate = std::unique_ptr<X509, FreeWith<X509_free>>;
using Number = std::unique_ptr<BIGNUM, FreeWith<BN_free>>;
using Extension = std::unique_ptr<X509_EXTENSION, FreeWith<X509_EXTENSION_free>>;

struct FreeOpenSsl {
    void operator()(unsigned char *bytes) const { OPENSSL_free(bytes); }
};

Unexpected cryptoFailure(const std::string &what) {
    std::array<char, 256> reason{};
    ERR_error_string_n(ERR_get_error(), reason.data(), reason.size());
    return Unexpected({what + ": " + reason.data()});
}

Unexpected unusable(const std::string &path, const std::string &why) {
    return Unexpected({path + " cannot be used: " + why});
}

constexpr char kNoKey[] = "no sound private key that can be read without a pass phrase";

/// A key that needs a pass phrase is refused: the daemon cannot prompt.
int noPassPhrase(char *, int, int, void *) {
    return -1;
}

/// A view of the text.
Bio bioOf(const std::string &text) {
    return Bio(BIO_new_mem_buf(text.data(), static_cast<int>(text.size())));
}

/// Both halves belong together, which OpenSSL does not ask when it reads them.
bool isWhole(EVP_PKEY *key) {
    const std::unique_ptr<EVP_PKEY_CTX, FreeWith<EVP_PKEY_CTX_free>> check(
        EVP_PKEY_CTX_new(key, nullptr));
    return check && EVP_PKEY_pairwise_check(check.get()) == 1;
}

Key readKey(const std::string &text) {
    Key key(PEM_read_bio_PrivateKey(bioOf(text).get(), nullptr, noPassPhrase, nullptr));
    return key && isWhole(key.get()) ? std::move(key) : nullptr;
}

Certificate readCertificate(const std::string &text) {
    return Certificate(PEM_read_bio_X509(bioOf(text).get(), nullptr, noPassPhrase, nullptr));
}

Expected<Key> loadKey(const std::string &path) {
    const Expected<OvraBase::Secret> text =
        OvraBase::readPrivateFile(path, OvraBase::Links::kFollow);
    if (!text) {
        return unusable(path, text.error().text);
    }
    Key key = readKey(text->get());
    if (!key) {
        return unusable(path, std::string("it holds ") + kNoKey);
    }
    return key;
}

Certificate loadCertificate(const std::string &path) {
    const Expected<std::string> text = OvraBase::readFile(path);
    return text ? readCertificate(*text) : nullptr;
}

std::string_view contentOf(BIO *bio) {
    char *data = nullptr;
    const long size = BIO_get_mem_data(bio, &data);
    return {data, size > 0 ? static_cast<std::size_t>(size) : 0};
}

/// In the form that X509V3_EXT_nconf_nid reads; see x509v3_config(5).
std::string alternativeNames(const ServerNames &names) {
    std::string text = OvraBase::isHostName(names.hostname) ? "DNS:" + names.hostname : "";
    for (const std::string &address : names.addresses) {
        text += (text.empty() ? "IP:" : ",IP:") + address;
    }
    return text;
}

bool addExtension(X509 *certificate, int nid, const std::string &value) {
    const Extension extension(X509V3_EXT_nconf_nid(nullptr, nullptr, nid, value.c_str()));
    return extension && X509_add_ext(certificate, extension.get(), -1) == 1;
}

bool setSerial(X509 *certificate) {
    const Number serial(BN_new());
    return serial && BN_rand(serial.get(), kSerialBits, BN_RAND_TOP_ONE, BN_RAND_BOTTOM_ANY) == 1 &&
           BN_to_ASN1_INTEGER(serial.get(), X509_get_serialNumber(certificate)) != nullptr;
}

bool setNames(X509 *certificate, const ServerNames &names) {
    const bool fits =
        OvraBase::isHostName(names.hostname) && names.hostname.size() <= kMaxCommonName;
    const std::string common = fits ? names.hostname : "ovradrd";
    X509_NAME *subject = X509_get_subject_name(certificate);
    const std::string alternatives = alternativeNames(names);
    return X509_NAME_add_entry_by_txt(subject, "CN", MBSTRING_ASC,
                                      // The library only reads it.
                                      reinterpret_cast<const unsigned char *>(common.c_str()), -1,
                                      -1, 0) == 1 &&
           X509_set_issuer_name(certificate, subject) == 1 &&
           (alternatives.empty() || addExtension(certificate, NID_subject_alt_name, alternatives));
}

Certificate makeCertificate(EVP_PKEY *key, const ServerNames &names) {
    Certificate certificate(X509_new());
    X509 *const made = certificate.get();
    const bool complete =
        certificate && X509_set_version(made, X509_VERSION_3) == 1 && setSerial(made) &&
        X509_gmtime_adj(X509_getm_notBefore(made), -kBackdatedSeconds) != nullptr &&
        X509_time_adj_ex(X509_getm_notAfter(made), kDays, 0, nullptr) != nullptr &&
        X509_set_pubkey(made, key) == 1 && setNames(made, names) &&
        addExtension(made, NID_basic_constraints, "critical,CA:FALSE") &&
        addExtension(made, NID_key_usage, "critical,digitalSignature") &&
        addExtension(made, NID_ext_key_usage, "serverAuth") &&
        X509_sign(made, key, EVP_sha256()) > 0;
    return complete ? std::move(certificate) : nullptr;
}

} // namespace

Expected<bool> createTlsKey(const std::string &path) {
    const Key key(EVP_PKEY_Q_keygen(nullptr, nullptr, "EC", "P-256"));
    const Bio text(BIO_new(BIO_s_secmem()));
    if (!key || !text ||
        PEM_write_bio_PKCS8PrivateKey(text.get(), key.get(), nullptr, nullptr, 0, nullptr,
                                      nullptr) != 1) {
        return cryptoFailure("No key can be made");
    }
    Expected<bool> made = OvraBase::createFile(path, contentOf(text.get()), 0600);
    if (!made) {
        return made;
    }
    if (const Expected<Key> stored = loadKey(path); !stored) {
        return Unexpected(stored.error());
    }
    return made;
}

Expected<bool> createCertificate(const std::string &path, const std::string &keyPath,
                                 const ServerNames &names) {
    const Expected<Key> key = loadKey(keyPath);
    if (!key) {
        return Unexpected(key.error());
    }
    const Certificate certificate = makeCertificate(key->get(), names);
    const Bio text(BIO_new(BIO_s_mem()));
    if (!certificate || !text || PEM_write_bio_X509(text.get(), certificate.get()) != 1) {
        return cryptoFailure("No certificate can be made");
    }
    Expected<bool> made = OvraBase::createFile(path, contentOf(text.get()), 0644);
    if (!made) {
        return made;
    }
    const Certificate stored = loadCertificate(path);
    if (!stored || X509_check_private_key(stored.get(), key->get()) != 1) {
        return unusable(path, "it holds no certificate of the key in " + keyPath);
    }
    return made;
}

std::string pairProblem(const std::string &key, const std::string &certificate) {
    const Key readable = readKey(key);
    const Certificate read = readCertificate(certificate);
    if (!readable || !read) {
        return std::string("there is ") + (readable ? "no certificate" : kNoKey);
    }
    return X509_check_private_key(read.get(), readable.get()) == 1
               ? ""
               : "the certificate is not of this key";
}

std::string certificateFingerprint(const std::string &path) {
    const Certificate certificate = loadCertificate(path);
    unsigned char *encoded = nullptr;
    const int size =
        certificate ? i2d_X509_PUBKEY(X509_get_X509_PUBKEY(certificate.get()), &encoded) : 0;
    const std::unique_ptr<unsigned char, FreeOpenSsl> owner(encoded);
    if (size <= 0 || !OvraBase::sodiumReady()) {
        return {};
    }
    return OvraBase::fingerprintOf(encoded, static_cast<std::size_t>(size));
}

} // namespace OvraService
