// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/appliance.h"
#include "ovraplatform/export.h"

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>
#include <tuple>
#include <vector>

namespace OvraBase {
class FileUpdate;
} // namespace OvraBase

namespace OvraPlatform {

/// What the store says about an endpoint's key.
enum class TrustVerdict {
    kTrusted,     ///< it is the pinned one
    kUnknown,     ///< no key is pinned for the endpoint
    kDifferent,   ///< another key is pinned
    kUnavailable, ///< the file cannot be read or written; an ERR line says why
};

/// The keys that endpoints had at first contact: a text file of mode 0600 with a line "ENDPOINT
/// FINGERPRINT" for each, shared by all processes of the appliance.
///
/// A change is made under a lock and replaces the file atomically, so that readers need no lock and
/// a crash leaves either the old file or the new one. Foreign lines are kept and ignored; of two
/// lines for one endpoint the first counts.
class OVRAPLATFORM_EXPORT TrustStore {
public:
    struct Entry {
        std::string endpoint;    ///< "https://host:5001", in lower case
        std::string fingerprint; ///< "SHA256:..."
    };
    /// Changes when the file does.
    using Stamp = std::tuple<dev_t, ino_t, std::int64_t, std::int64_t, off_t>;

    explicit TrustStore(std::string path = kKnownEndpointsFile);

    TrustVerdict lookup(const std::string &endpoint, const std::string &fingerprint) const;
    /// Trusts the key from now on, unless another one is pinned.
    /// \return kTrusted, kDifferent or kUnavailable
    TrustVerdict pin(const std::string &endpoint, const std::string &fingerprint);
    /// Drops the key of the endpoint. \return false if the file could not be changed; an endpoint
    /// without a key is not a failure.
    [[nodiscard]] bool forget(const std::string &endpoint);
    /// Every pinned key in file order; std::nullopt if the file cannot be read.
    std::optional<std::vector<Entry>> list() const;
    /// For callers that cache a lookup: it is valid as long as the stamp is unchanged.
    Stamp stamp() const;

private:
    struct Line;

    std::optional<std::vector<Line>> read() const;
    [[nodiscard]] bool write(const OvraBase::FileUpdate &file,
                             const std::vector<Line> &lines) const;

    std::string path_;
};

} // namespace OvraPlatform
