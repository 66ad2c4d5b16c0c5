// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>
#include <ovrabase/secret.h>

#include <gnutls/gnutls.h>

#include <memory>
#include <string>
#include <type_traits>

namespace OvraService {

struct FreeTlsCredentials {
    void operator()(gnutls_certificate_credentials_t credentials) const {
        gnutls_certificate_free_credentials(credentials);
    }
};
/// A key and certificate as the TLS library takes them.
using TlsCredentials =
    std::unique_ptr<std::remove_pointer_t<gnutls_certificate_credentials_t>, FreeTlsCredentials>;

/// A daemon's TLS key and certificate, as PEM text.
struct TlsIdentity {
    OvraBase::Secret key;
    std::string certificate;

    /// Reads both files and checks that they belong together.
    [[nodiscard]] static OvraBase::Expected<TlsIdentity> load(const std::string &keyFile,
                                                              const std::string &certificateFile);

    [[nodiscard]] OvraBase::Expected<TlsCredentials> credentials() const;
};

} // namespace OvraService
