// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <string>
#include <vector>

// Keys and certificates for HTTPS, as the daemons show them. Errors with a number are those of the
// files; others say in one sentence what is wrong with a file or with the machine.
namespace OvraService {

/// Makes the private key of the HTTPS server (P-256, PEM, mode 0600), or checks the one that is
/// there.
/// \return whether this call made it
[[nodiscard]] OvraBase::Expected<bool> createTlsKey(const std::string &path);

/// What a certificate is made for.
struct ServerNames {
    std::string hostname;
    std::vector<std::string> addresses; ///< numeric
};

/// Makes a certificate for the key, signed by itself and good for ten years (PEM, mode 0644), or
/// checks that the one that is there belongs to the key. Who connects trusts the key, not the
/// names: one that is there stays even if the appliance has got another name.
/// \return whether this call made it
[[nodiscard]] OvraBase::Expected<bool>
createCertificate(const std::string &path, const std::string &keyPath, const ServerNames &names);

/// The fingerprint of the certificate's public key as those who connect see it ("SHA256:..."); ""
/// if the file holds none.
std::string certificateFingerprint(const std::string &path);

} // namespace OvraService
