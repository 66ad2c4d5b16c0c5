// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace Farlinkd {

/// A name under which an appliance is reached.
struct Alias {
    std::string name;
    std::string key; ///< the public key whose owner has it, base64url
    int port = 0;    ///< where its callers connect
    std::int64_t expires = 0;
};

/// Who has which alias: a text file of mode 0600, replaced whole with every change. An alias
/// belongs to the first key that asks for it, until it has not been enrolled for the lease. For one
/// thread at a time.
class AliasRegistry {
public:
    struct Limits {
        int firstPort = 0; ///< one port an alias, so as many aliases as ports
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
        kTooMany,   ///< the key has as many as it may
        kNotStored, ///< the file cannot be written; nothing changed
    };

    AliasRegistry(std::string path, const Limits &limits);

    /// Reads the file; a missing one is an empty registry. Entries outside the ports are dropped.
    [[nodiscard]] OvraBase::Expected<void> load();
    /// \param now  seconds since 1970, here and below
    [[nodiscard]] tl::expected<Enrolment, Refusal> enrol(const std::string &name,
                                                         const std::string &key, std::int64_t now);
    /// Null for an alias that nobody has.
    const Alias *find(const std::string &name) const;
    /// \return false when there is none, or the file cannot be written
    [[nodiscard]] bool release(const std::string &name);
    /// Takes out what has expired. \return what that was
    std::vector<Alias> dropExpired(std::int64_t now);
    std::vector<Alias> list() const;

private:
    using Entries = std::map<std::string, Alias>;

    [[nodiscard]] bool store(const Entries &entries, int nextPort) const;
    int freePort() const;

    std::string path_;
    Limits limits_;
    Entries entries_;
    /// Ports go round, so that one that becomes free stays so for as long as possible: those who
    /// called its last owner know a key there.
    int nextPort_;
};

} // namespace Farlinkd
