// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "provision/new_file.h"

#include <string>
#include <vector>

namespace Ovradr {

/// Makes the private key of the HTTPS server (P-256, PEM, mode 0600), or checks the one that is
/// there.
Expected<SetUpStep> provisionTlsKey(const std::string &path);

/// What a certificate is made for.
struct ServerNames {
    std::string hostname;
    std::vector<std::string> addresses; ///< numeric
};

/// Makes a certificate for the key, signed by itself and good for ten years (PEM, mode 0644), or
/// checks that the one that is there belongs to the key. Who connects trusts the key, not the
/// names: one that is there stays also when the appliance has got another name.
Expected<SetUpStep> provisionCertificate(const std::string &path, const std::string &keyPath,
                                         const ServerNames &names);

/// The fingerprint of the certificate's public key as those who connect see it ("SHA256:..."); ""
/// when the file holds none.
std::string certificateFingerprint(const std::string &path);

} // namespace Ovradr
