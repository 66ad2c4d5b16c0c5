// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace Farlinkd {

/// A name under which an appliance is reached.
struct Alias {
    std::string name;
    std::string key; ///< its owner's public key, base64url
    int port = 0;    ///< where its callers connect
    std::int64_t expires = 0;
};

/// The owners of aliases: a text file of mode 0600, replaced whole with every change. An alias
/// belongs to the first key that claims it, until it has not been enrolled for the length of the
/// lease. One thread at a time may change it, and waits for the disk; any may read meanwhile, and
/// sees a change once it is stored.
class AliasRegistry {
public:
    struct Limits {
        int firstPort = 0; ///< one port per alias, so as many aliases as ports
        int lastPort = 0;
        std::chrono::seconds lease{};
        std::size_t perKey = 4;
    };
    struct Enrolment {
        Alias alias;
        bool isNew = false; ///< otherwise it was renewed
    };
    enum class Refusal {
        kTaken,     ///< another key has it
        kFull,      ///< no port is left
        kTooMany,   ///< the key has reached its limit
        kNotStored, ///< the file cannot be written; nothing changed
    };

    AliasRegistry(std::string path, const Limits &limits);

    /// Reads the file; a missing one is an empty registry. Drops entries outside the port range.
    [[nodiscard]] OvraBase::Expected<void> load();
    /// \param now  seconds since 1970, here and below
    [[nodiscard]] tl::expected<Enrolment, Refusal> enrol(const std::string &name,
                                                         const std::string &key, std::int64_t now);
    /// std::nullopt for an unowned alias.
    std::optional<Alias> find(const std::string &name) const;
    /// \return false if there is none, or the file cannot be written
    [[nodiscard]] bool release(const std::string &name);
    /// Removes expired entries. \return those removed
    std::vector<Alias> dropExpired(std::int64_t now);
    std::vector<Alias> list() const;

private:
    using Entries = std::map<std::string, Alias>;

    [[nodiscard]] bool store(const Entries &entries, int nextPort) const;
    void replaceEntries(Entries entries);
    int freePort() const;

    std::string path_;
    Limits limits_;
    mutable std::mutex mutex_; ///< of the entries, against their replacement
    Entries entries_;
    /// Ports rotate, so that a freed one stays free for as long as possible: callers of its last
    /// owner have pinned a key there.
    int nextPort_;
};

} // namespace Farlinkd
