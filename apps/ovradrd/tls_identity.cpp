// SPDX-License-Identifier: Apache-2.0
#include "tls_identity.h"

#include <gnutls/gnutls.h>
#include <sodium.h>
#include <sys/stat.h>

#include <cerrno>
#include <fstream>
#include <iterator>
#include <memory>
#include <system_error>
#include <type_traits>

namespace Ovradrd {

namespace {

struct FreeCredentials {
    void operator()(gnutls_certificate_credentials_t credentials) const {
        gnutls_certificate_free_credentials(credentials);
    }
};
using Credentials =
    std::unique_ptr<std::remove_pointer_t<gnutls_certificate_credentials_t>, FreeCredentials>;

bool readFile(const std::string &path, std::string &text, std::string &why) {
    std::ifstream file(path, std::ios::binary);
    text.assign(std::istreambuf_iterator<char>(file), {});
    if (!file.is_open() || file.bad()) {
        why = path + " cannot be read (" + std::system_category().message(errno) +
              "): run ovradr setup";
        return false;
    }
    return true;
}

bool isPrivate(const std::string &path, std::string &why) {
    struct stat status {};
    if (stat(path.c_str(), &status) == 0 && (status.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
        why = path + " can be read by others: set its mode to 0600";
        return false;
    }
    return true;
}

gnutls_datum_t datumOf(std::string &text) {
    return {reinterpret_cast<unsigned char *>(text.data()), static_cast<unsigned int>(text.size())};
}

} // namespace

TlsIdentity::~TlsIdentity() {
    sodium_memzero(key.data(), key.size());
}

std::optional<TlsIdentity> TlsIdentity::load(const std::string &keyFile,
                                             const std::string &certificateFile, std::string &why) {
    TlsIdentity identity;
    if (!isPrivate(keyFile, why) || !readFile(keyFile, identity.key, why) ||
        !readFile(certificateFile, identity.certificate, why)) {
        return std::nullopt;
    }
    gnutls_certificate_credentials_t raw = nullptr;
    if (gnutls_certificate_allocate_credentials(&raw) != GNUTLS_E_SUCCESS) {
        why = "no memory for the TLS key";
        return std::nullopt;
    }
    const Credentials credentials(raw);
    const gnutls_datum_t key = datumOf(identity.key);
    const gnutls_datum_t certificate = datumOf(identity.certificate);
    const int code = gnutls_certificate_set_x509_key_mem(credentials.get(), &certificate, &key,
                                                         GNUTLS_X509_FMT_PEM);
    if (code < 0) {
        why = keyFile + " and " + certificateFile + " are not a key and its certificate (" +
              gnutls_strerror(code) +
              "): put the right ones there, or remove both and run ovradr "
              "setup";
        return std::nullopt;
    }
    return identity;
}

} // namespace Ovradrd
