// SPDX-License-Identifier: Apache-2.0
#include "alias_registry.h"

#include <ovrabase/file.h>
#include <ovradrcore/log.h>
#include <ovraplatform/farlink.h>

#include <algorithm>
#include <cerrno>
#include <set>
#include <sstream>
#include <utility>

namespace Farlinkd {

namespace {

constexpr char kHeading[] = "farlink-aliases-1";
constexpr mode_t kMode = 0600;
/// What an owner's key consists of (RFC 4648, section 5).
constexpr char kBase64Url[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";

bool atEnd(std::istringstream &words) {
    return (words >> std::ws).eof();
}

bool readHeading(std::istringstream &words, int &nextPort) {
    std::string heading;
    return words >> heading >> nextPort && heading == kHeading && atEnd(words);
}

bool readAlias(std::istringstream &words, Alias &alias) {
    return words >> alias.name >> alias.port >> alias.expires >> alias.key && atEnd(words) &&
           OvraPlatform::isFarlinkAlias(alias.name) &&
           alias.key.find_first_not_of(kBase64Url) == std::string::npos;
}

} // namespace

AliasRegistry::AliasRegistry(std::string path, const Limits &limits)
    : path_(std::move(path))
    , limits_(limits)
    , nextPort_(limits.firstPort) {}

OvraBase::Expected<void> AliasRegistry::load() {
    const OvraBase::Expected<std::string> text =
        OvraBase::readFile(path_, OvraBase::Links::kRefuse);
    if (!text && text.error().number == ENOENT) {
        return {};
    }
    const auto damaged = [this](const std::string &what) {
        return OvraBase::Unexpected({path_ + " cannot be read or is no list of aliases" + what +
                                     ": restore it, or move it away, and its aliases are free "
                                     "again"});
    };
    std::istringstream lines(text.value_or(""));
    std::string line;
    std::getline(lines, line);
    if (std::istringstream words(line); !readHeading(words, nextPort_)) {
        return damaged("");
    }
    if (nextPort_ < limits_.firstPort || nextPort_ > limits_.lastPort) {
        nextPort_ = limits_.firstPort;
    }
    std::set<int> ports;
    for (int number = 2; std::getline(lines, line); ++number) {
        std::istringstream words(line);
        Alias alias;
        if (!readAlias(words, alias)) {
            // To go on would free the alias, for somebody else to take.
            return damaged(" (line " + std::to_string(number) + ")");
        }
        if (alias.port >= limits_.firstPort && alias.port <= limits_.lastPort &&
            entries_.count(alias.name) == 0 && ports.insert(alias.port).second) {
            entries_[alias.name] = alias;
        } else {
            OVRA_WARN("The alias [%s] at port [%d] is dropped: its port is not, or no longer, one "
                      "of this service, or another line has the same",
                      alias.name.c_str(), alias.port);
        }
    }
    if (lines.bad()) {
        return OvraBase::Unexpected({"there is no memory to read " + path_, ENOMEM});
    }
    return {};
}

tl::expected<AliasRegistry::Enrolment, AliasRegistry::Refusal>
AliasRegistry::enrol(const std::string &name, const std::string &key, std::int64_t now) {
    Alias alias;
    Entries changed = entries_;
    const auto found = changed.find(name);
    const bool isNew = found == changed.end() || found->second.expires <= now;
    if (!isNew && found->second.key != key) {
        return tl::unexpected(Refusal::kTaken);
    }
    int nextPort = nextPort_;
    if (found == changed.end()) {
        const auto ofKey = std::count_if(changed.begin(), changed.end(), [&key](const auto &entry) {
            return entry.second.key == key;
        });
        if (static_cast<std::size_t>(ofKey) >= limits_.perKey) {
            return tl::unexpected(Refusal::kTooMany);
        }
        alias.port = freePort();
        if (alias.port == 0) {
            return tl::unexpected(Refusal::kFull);
        }
        nextPort = alias.port + 1;
    } else {
        alias.port = found->second.port;
    }
    alias.name = name;
    alias.key = key;
    alias.expires = now + limits_.lease.count();
    changed[name] = alias;
    if (!store(changed, nextPort)) {
        return tl::unexpected(Refusal::kNotStored);
    }
    replaceEntries(std::move(changed));
    nextPort_ = nextPort;
    return Enrolment{alias, isNew};
}

std::optional<Alias> AliasRegistry::find(const std::string &name) const {
    const std::lock_guard lock(mutex_);
    const auto found = entries_.find(name);
    return found == entries_.end() ? std::nullopt : std::optional(found->second);
}

bool AliasRegistry::release(const std::string &name) {
    Entries changed = entries_;
    if (changed.erase(name) == 0 || !store(changed, nextPort_)) {
        return false;
    }
    replaceEntries(std::move(changed));
    return true;
}

std::vector<Alias> AliasRegistry::dropExpired(std::int64_t now) {
    const auto expired = [now](const auto &entry) { return entry.second.expires <= now; };
    std::vector<Alias> dropped;
    if (std::none_of(entries_.begin(), entries_.end(), expired)) {
        return dropped;
    }
    Entries changed;
    for (const auto &entry : entries_) {
        if (expired(entry)) {
            dropped.push_back(entry.second);
        } else {
            changed.insert(entry);
        }
    }
    // What could not be stored has expired all the same, and is dropped again after a restart.
    (void)store(changed, nextPort_);
    replaceEntries(std::move(changed));
    return dropped;
}

void AliasRegistry::replaceEntries(Entries entries) {
    const std::lock_guard lock(mutex_);
    entries_.swap(entries);
}

std::vector<Alias> AliasRegistry::list() const {
    const std::lock_guard lock(mutex_);
    std::vector<Alias> all;
    for (const auto &[name, alias] : entries_) {
        all.push_back(alias);
    }
    return all;
}

bool AliasRegistry::store(const Entries &entries, int nextPort) const {
    std::ostringstream text;
    text << kHeading << ' ' << nextPort << '\n';
    for (const auto &[name, alias] : entries) {
        text << name << ' ' << alias.port << ' ' << alias.expires << ' ' << alias.key << '\n';
    }
    if (!text) { // a stream takes exceptions for itself
        OVRA_ERR("[%s] is not written: there is no memory for the list", path_.c_str());
        return false;
    }
    const auto stored = OvraBase::FileUpdate::begin(path_).and_then(
        [&text](const OvraBase::FileUpdate &file) { return file.commit(text.str(), kMode); });
    if (!stored) {
        OVRA_ERR("[%s] cannot be written: [%s]", path_.c_str(), stored.error().text.c_str());
    }
    return stored.has_value();
}

/// 0 if all are taken.
int AliasRegistry::freePort() const {
    std::set<int> taken;
    for (const auto &[name, alias] : entries_) {
        taken.insert(alias.port);
    }
    const int count = limits_.lastPort - limits_.firstPort + 1;
    for (int i = 0; i < count; ++i) {
        const int port = limits_.firstPort + (nextPort_ - limits_.firstPort + i) % count;
        if (taken.count(port) == 0) {
            return port;
        }
    }
    return 0;
}

} // namespace Farlinkd
