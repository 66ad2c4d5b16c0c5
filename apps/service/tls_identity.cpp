// SPDX-License-Identifier: Apache-2.0
#include "service/tls_identity.h"

#include "service/certificate.h"

#include <ovrabase/file.h>

#include <gnutls/gnutls.h>

#include <cerrno>
#include <utility>

namespace OvraService {

namespace {

using OvraBase::Unexpected;

Unexpected unreadable(const std::string &path, const OvraBase::Error &why) {
    return why.number == EPERM
               ? Unexpected(
                     {path + ": " + why.text + ": set its owner, and its mode to 0600", why.number})
               : Unexpected(
                     {path + " cannot be read (" + why.text + "): run ovradr setup", why.number});
}

/// The library only reads it.
gnutls_datum_t datumOf(const std::string &text) {
    return {reinterpret_cast<unsigned char *>(const_cast<char *>(text.data())),
            static_cast<unsigned int>(text.size())};
}

} // namespace

OvraBase::Expected<TlsIdentity> TlsIdentity::load(const std::string &keyFile,
                                                  const std::string &certificateFile) {
    OvraBase::Expected<OvraBase::Secret> key =
        OvraBase::readPrivateFile(keyFile, OvraBase::Links::kFollow);
    if (!key) {
        return unreadable(keyFile, key.error());
    }
    OvraBase::Expected<std::string> certificate = OvraBase::readFile(certificateFile);
    if (!certificate) {
        return unreadable(certificateFile, certificate.error());
    }
    TlsIdentity identity{std::move(*key), std::move(*certificate)};
    if (const auto usable = identity.credentials(); !usable) {
        return Unexpected({keyFile + " and " + certificateFile +
                           " are not a key and its certificate (" + usable.error().text +
                           "): put the right ones there, or remove both and run ovradr setup"});
    }
    return identity;
}

OvraBase::Expected<TlsCredentials> TlsIdentity::credentials() const {
    gnutls_certificate_credentials_t raw = nullptr;
    if (gnutls_certificate_allocate_credentials(&raw) != GNUTLS_E_SUCCESS) {
        return Unexpected({"no memory for the TLS key"});
    }
    TlsCredentials credentials(raw);
    const gnutls_datum_t keyDatum = datumOf(key.get());
    const gnutls_datum_t certificateDatum = datumOf(certificate);
    const int code =
        gnutls_certificate_set_x509_key_mem(raw, &certificateDatum, &keyDatum, GNUTLS_X509_FMT_PEM);
    const std::string problem =
        code < 0 ? gnutls_strerror(code) : pairProblem(key.get(), certificate);
    if (!problem.empty()) {
        return Unexpected({problem});
    }
    return credentials;
}

} // namespace OvraService
