// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>
#include <ovrabase/secret.h>

#include <string>

namespace OvraService {

/// A daemon's TLS key and certificate, as PEM text.
struct TlsIdentity {
    OvraBase::Secret key;
    std::string certificate;

    /// Reads both files and checks that they belong together.
    [[nodiscard]] static OvraBase::Expected<TlsIdentity> load(const std::string &keyFile,
                                                              const std::string &certificateFile);
};

} // namespace OvraService
