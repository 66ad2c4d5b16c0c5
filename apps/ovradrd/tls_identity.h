// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <optional>
#include <string>

namespace Ovradrd {

/// What the appliance shows to TLS clients, as PEM text. The key is wiped when it goes.
struct TlsIdentity {
    std::string key;
    std::string certificate;

    TlsIdentity() = default;
    TlsIdentity(TlsIdentity &&) = default;
    TlsIdentity &operator=(TlsIdentity &&) = default;
    TlsIdentity(const TlsIdentity &) = delete;
    TlsIdentity &operator=(const TlsIdentity &) = delete;
    ~TlsIdentity();

    /// Reads both files and checks that they belong together.
    /// \param why  takes one sentence when nothing is returned
    static std::optional<TlsIdentity> load(const std::string &keyFile,
                                           const std::string &certificateFile, std::string &why);
};

} // namespace Ovradrd
