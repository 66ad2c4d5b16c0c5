// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/appliance.h"
#include "ovraplatform/export.h"

#include <sys/types.h>
#include <tl/expected.hpp>

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
    kUnknown,     ///< nothing is known of the endpoint
    kDifferent,   ///< another key is pinned
    kVouched,     ///< no key is pinned: the system's certificates vouched for the endpoint before
    kForgotten,   ///< a person has withdrawn its key
    kLost,        ///< the file is missing or damaged, so that a key of the endpoint may be lost
    kUnavailable, ///< the file cannot be read or written; an ERR line says why
    kShortage,    ///< this process has no descriptor or memory left to read the file
};

/// The keys by which endpoints are known: a text file of mode 0600 with a line "ENDPOINT VALUE" for
/// each, shared by all processes of the appliance; docs/files.md describes it.
///
/// Of an endpoint that the file does not name only a sound file says that it is unknown: without
/// the file, or with a damaged one, its key may be lost, and nobody but a person trusts it anew.
/// A change is made under a lock and replaces the file atomically, so that readers need no lock and
/// a crash leaves either the old file or the new one. Foreign lines are kept; of two lines for one
/// endpoint the first counts.
class OVRAPLATFORM_EXPORT TrustStore {
public:
    /// The values that are no fingerprint.
    static constexpr char kSystem[] = "system";
    static constexpr char kForgotten[] = "forgotten";

    struct Entry {
        std::string endpoint;   ///< "https://host:5001" in lower case, or "flk:alias"
        std::string value;      ///< "SHA256:...", kSystem or kForgotten
        std::int64_t since = 0; ///< when that was noted, in seconds of the system clock; 0: unknown
    };
    /// Changes when the file does.
    using Stamp = std::tuple<dev_t, ino_t, std::int64_t, std::int64_t, off_t>;

    explicit TrustStore(std::string path = kKnownEndpointsFile);

    /// Makes the file where it is missing or empty, gives one of an older version its heading, and
    /// ends the state of one that was lost and begun anew by trust(): not while a key of the
    /// appliance may still be lost.
    /// \return whether there is a sound file now
    [[nodiscard]] bool create();
    /// What is wrong with the file, as a sentence without its end; "" if it is sound.
    [[nodiscard]] std::string problem() const;

    TrustVerdict lookup(const std::string &endpoint, const std::string &fingerprint) const;
    /// Trusts the key of an endpoint that is unknown, from now on.
    /// \return as lookup() afterwards, or kUnavailable
    TrustVerdict pin(const std::string &endpoint, const std::string &fingerprint);
    /// Notes that the system's certificates vouch for an endpoint that is unknown; as pin().
    TrustVerdict vouch(const std::string &endpoint);
    /// A person's decision: trusts a key, or with kSystem what the system's certificates vouch for.
    /// Makes the file if need be; all other endpoints stay lost then, see create().
    /// \param replace  also in place of another pinned key
    /// \return kTrusted; kDifferent if another key is pinned, which stays; kUnavailable
    TrustVerdict trust(const std::string &endpoint, const std::string &value, bool replace);
    /// Takes a decision back: puts back what was known of the endpoint before trust(), unless
    /// something else than its `value` is known by now.
    /// \param before  of find() then; std::nullopt: nothing
    /// \return false if the file could not be changed.
    [[nodiscard]] bool undoTrust(const std::string &endpoint, const std::string &value,
                                 const std::optional<Entry> &before);
    /// A person's decision: withdraws what is known of the endpoint; only trust() makes it known
    /// again. \return false if the file could not be changed; an endpoint that is not named in it
    /// is not a failure.
    [[nodiscard]] bool forget(const std::string &endpoint);
    /// What is known of the endpoint; std::nullopt if that is nothing or cannot be read.
    std::optional<Entry> find(const std::string &endpoint) const;
    /// Every endpoint in file order; std::nullopt if the file cannot be read.
    std::optional<std::vector<Entry>> list() const;
    /// For callers that cache a lookup: it is valid as long as the stamp is unchanged.
    Stamp stamp() const;

private:
    struct Line;
    struct Content;
    struct Change;

    tl::expected<Content, TrustVerdict> read() const;
    tl::expected<Change, TrustVerdict> beginChange() const;
    TrustVerdict add(const Entry &entry);
    [[nodiscard]] tl::expected<void, TrustVerdict> write(const OvraBase::FileUpdate &file,
                                                         const Content &content) const;

    std::string path_;
};

} // namespace OvraPlatform
