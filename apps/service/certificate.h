// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <string>
#include <vector>

// Keys and certificates for HTTPS, as shown by the daemons. Errors with a number come from the
// files; others say what is wrong with a file or the machine.
namespace OvraService {

/// Creates the private key of the HTTPS server (P-256, PEM, mode 0600), or checks the existing one.
/// \return whether this call created it
[[nodiscard]] OvraBase::Expected<bool> createTlsKey(const std::string &path);

/// What a certificate is made for.
struct ServerNames {
    std::string hostname;
    std::vector<std::string> addresses; ///< numeric
};

/// Creates a self-signed certificate for the key, valid for ten years (PEM, mode 0644), or checks
/// that the existing one belongs to the key. Clients trust the key, not the names: an existing one
/// stays even if the appliance has a new name.
/// \return whether this call created it
[[nodiscard]] OvraBase::Expected<bool>
createCertificate(const std::string &path, const std::string &keyPath, const ServerNames &names);

/// Why no client could connect to a server with this key and this certificate, e.g. "the
/// certificate is not of this key"; "" if they are sound. The key's halves are compared, too: a
/// server starts with ones that do not belong together.
std::string pairProblem(const std::string &key, const std::string &certificate);

/// The fingerprint of the certificate's public key as clients see it ("SHA256:..."); "" if the file
/// holds none.
std::string certificateFingerprint(const std::string &path);

} // namespace OvraService
