// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/trust_store.h"

#include <ovrabase/connect.h>
#include <ovrabase/encoding.h>
#include <ovrabase/file.h>
#include <ovrabase/number.h>
#include <ovradrcore/log.h>

#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <ctime>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <utility>

namespace OvraPlatform {

namespace {

constexpr std::string_view kHeading = "# ovradr-trust 1";
constexpr std::string_view kSince = "#since ";
/// What the heading of any version begins with.
constexpr std::string_view kAnyHeading = "# ovradr-trust ";
/// Stands in a file that was begun anew after one was lost. A program that does not know it takes
/// it for damage, which has the same effect.
constexpr std::string_view kLostLine = "lost";

/// When the file changed whose damage was logged last, so that damage is logged once, not at every
/// request.
std::atomic<std::int64_t> toldOf{0};

std::int64_t nanoseconds(const timespec &time) {
    constexpr std::int64_t kNanosecondsPerSecond = 1'000'000'000;
    return time.tv_sec * kNanosecondsPerSecond + time.tv_nsec;
}

bool isEndpoint(const std::string &text) {
    const bool protocol =
        text.starts_with("https://") || text.starts_with("http://") || text.starts_with("flk:");
    return protocol && std::all_of(text.begin(), text.end(), [](char c) { return c > ' '; });
}

/// The system's certificates vouch for HTTPS endpoints only, and for no alias.
bool isValueFor(const std::string &endpoint, const std::string &value) {
    return OvraBase::isFingerprint(value) || value == TrustStore::kForgotten ||
           (value == TrustStore::kSystem && endpoint.starts_with("https://"));
}

/// What it says of the keys that a file cannot be used.
TrustVerdict verdictOf(const OvraBase::Error &error) {
    return OvraBase::isShortage(error.number) ? TrustVerdict::kShortage
                                              : TrustVerdict::kUnavailable;
}

/// When the line of an endpoint was written is in a comment of its own, "#since SECONDS" and this
/// tag: an earlier version takes a third word for damage. The tag names the key, so that a line
/// that a person changes by hand leaves no wrong time behind.
std::string sinceTag(const TrustStore::Entry &entry) {
    constexpr std::size_t kTold = 15; // of a fingerprint "SHA256:" and 48 bits
    return " " + entry.endpoint + " " + entry.value.substr(0, kTold);
}

} // namespace

/// A line as it is in the file.
struct TrustStore::Line {
    std::string text;
    Entry entry; ///< the first word and the rest, whatever they are

    explicit Line(std::string line)
        : text(std::move(line))
        , entry{text.substr(0, text.find(' ')),
                text.substr(std::min(text.find(' '), text.size()))} {
        if (!entry.value.empty()) {
            entry.value.erase(0, 1);
        }
    }
    explicit Line(const Entry &of)
        : text(of.endpoint + " " + of.value)
        , entry(of) {}

    bool says() const { return !text.empty() && text.front() != '#'; }
    bool isSound() const {
        return isEndpoint(entry.endpoint) && isValueFor(entry.endpoint, entry.value);
    }
    bool isFor(const std::string &endpoint) const { return says() && entry.endpoint == endpoint; }
    bool tellsSince() const { return text.starts_with(kSince); }
    bool tellsSinceOf(const std::string &endpoint) const {
        return tellsSince() && text.find(" " + endpoint + " ") != std::string::npos;
    }
};

struct TrustStore::Content {
    std::vector<Line> lines;
    bool hasHeading = false;
    bool isGone = false; ///< whether it holds nothing, not even a heading
    std::string problem; ///< "" if it is sound

    explicit Content(const std::string &text) {
        for (std::size_t begin = 0; begin < text.size();) {
            const std::size_t end = std::min(text.find('\n', begin), text.size());
            lines.emplace_back(text.substr(begin, end - begin));
            begin = end + 1;
        }
        hasHeading = !lines.empty() && lines.front().text == kHeading;
        const auto isDamaged = [](const Line &line) { return line.says() && !line.isSound(); };
        const auto damaged = std::find_if(lines.begin(), lines.end(), isDamaged);
        // With endpoints and without a heading it is of the version before, which wrote none.
        isGone = !hasHeading && std::none_of(lines.begin(), lines.end(),
                                             [](const Line &line) { return line.says(); });
        if (damaged != lines.end()) {
            problem = damaged->text == kLostLine
                          ? "it was lost, and begun anew without the keys of all endpoints"
                          : "its line " + std::to_string(damaged - lines.begin() + 1) +
                                " cannot be understood";
        } else if (isGone) {
            problem = "it is empty";
        }
    }

    bool isNewer() const {
        return !hasHeading && !lines.empty() && lines.front().text.starts_with(kAnyHeading);
    }
    auto find(const std::string &endpoint) {
        return std::find_if(lines.begin(), lines.end(),
                            [&](const Line &line) { return line.isFor(endpoint); });
    }
    TrustVerdict verdictOn(const std::string &endpoint, const std::string &fingerprint) {
        const auto line = find(endpoint);
        if (line == lines.end()) {
            return problem.empty() ? TrustVerdict::kUnknown : TrustVerdict::kLost;
        }
        const std::string &value = line->entry.value;
        if (!line->isSound()) {
            return TrustVerdict::kLost;
        }
        if (value == kForgotten) {
            return TrustVerdict::kForgotten;
        }
        if (value == kSystem) {
            return TrustVerdict::kVouched;
        }
        return value == fingerprint ? TrustVerdict::kTrusted : TrustVerdict::kDifferent;
    }
    void remove(const std::string &endpoint) {
        std::erase_if(lines, [&endpoint](const Line &line) {
            return line.isFor(endpoint) || line.tellsSinceOf(endpoint);
        });
    }
    void put(const Entry &entry) {
        std::erase_if(lines, [&](const Line &line) { return line.tellsSinceOf(entry.endpoint); });
        if (entry.value != kForgotten) {
            lines.emplace_back(std::string(kSince) + std::to_string(std::time(nullptr)) +
                               sinceTag(entry));
        }
        if (const auto line = find(entry.endpoint); line != lines.end()) {
            *line = Line(entry);
        } else {
            lines.emplace_back(entry);
        }
    }
    void addHeading() {
        if (!hasHeading) {
            lines.insert(lines.begin(), Line(std::string(kHeading)));
            hasHeading = true;
        }
    }
};

/// What a change begins with.
struct TrustStore::Change {
    OvraBase::FileUpdate file; ///< holds the lock
    Content content;           ///< as it is under the lock
};

TrustStore::TrustStore(std::string path)
    : path_(std::move(path)) {}

tl::expected<TrustStore::Content, TrustVerdict> TrustStore::read() const {
    const OvraBase::Expected<std::string> text = OvraBase::readFile(path_);
    if (!text && text.error().number != ENOENT) {
        OVRA_ERR("The trusted keys in [%s] cannot be read (%s): repair the file", path_.c_str(),
                 text.error().text.c_str());
        return tl::unexpected(verdictOf(text.error()));
    }
    Content content(text.value_or(""));
    if (content.isNewer()) {
        OVRA_ERR("[%s] is of a newer version than this program: install that", path_.c_str());
        return tl::unexpected(TrustVerdict::kUnavailable);
    }
    if (!text) {
        content.problem = "it is missing";
    }
    const std::int64_t changed = std::get<2>(stamp());
    if (text && !content.problem.empty() && toldOf.exchange(changed) != changed) {
        OVRA_WARN("[%s] is damaged, %s: endpoints that it does not name are refused until a person "
                  "trusts them (ovradr conn trust)",
                  path_.c_str(), content.problem.c_str());
    }
    return content;
}

tl::expected<TrustStore::Change, TrustVerdict> TrustStore::beginChange() const {
    auto file = OvraBase::FileUpdate::begin(path_);
    if (!file) {
        OVRA_ERR("The trusted keys in [%s] cannot be changed: [%s]", path_.c_str(),
                 file.error().text.c_str());
        return tl::unexpected(verdictOf(file.error()));
    }
    return read().map([&file](Content &&content) {
        return Change{std::move(*file), std::move(content)};
    });
}

tl::expected<void, TrustVerdict> TrustStore::write(const OvraBase::FileUpdate &file,
                                                   const Content &content) const {
    const auto textOf = [&content](bool withSince) {
        std::string all;
        for (const Line &line : content.lines) {
            all += withSince || !line.tellsSince() ? line.text + '\n' : "";
        }
        return all;
    };
    std::string text = textOf(true);
    if (text.size() > OvraBase::kMaxTextFile) {
        text = textOf(false); // room for keys
    }
    const OvraBase::Expected<void> written = text.size() > OvraBase::kMaxTextFile
                                                 ? OvraBase::systemError(EFBIG)
                                                 : file.commit(text, 0600);
    if (!written) {
        OVRA_ERR("The trusted keys in [%s] cannot be written (%s): make room, remove endpoints "
                 "that are not used any more, or correct the rights",
                 path_.c_str(), written.error().text.c_str());
    }
    return written.map_error(verdictOf);
}

bool TrustStore::create() {
    if (!ensureStateDir(OvraBase::folderOf(path_))) {
        return false;
    }
    auto change = beginChange();
    if (!change) {
        return false;
    }
    Content &content = change->content;
    if (content.hasHeading && content.problem.empty()) {
        return true;
    }
    std::erase_if(content.lines, [](const Line &line) { return line.text == kLostLine; });
    if (std::any_of(content.lines.begin(), content.lines.end(),
                    [](const Line &line) { return line.says() && !line.isSound(); })) {
        return false;
    }
    content.addHeading();
    return write(change->file, content).has_value();
}

std::string TrustStore::problem() const {
    const auto content = read();
    return content ? content->problem : "it cannot be read, or is of a newer version";
}

TrustVerdict TrustStore::lookup(const std::string &endpoint, const std::string &fingerprint) const {
    auto content = read();
    return content ? content->verdictOn(endpoint, fingerprint) : content.error();
}

TrustVerdict TrustStore::add(const Entry &entry) {
    if (!isEndpoint(entry.endpoint) || !isValueFor(entry.endpoint, entry.value)) {
        return TrustVerdict::kUnavailable;
    }
    auto change = beginChange();
    if (!change) {
        return change.error();
    }
    Content &content = change->content;
    const TrustVerdict verdict = content.verdictOn(entry.endpoint, entry.value);
    if (verdict != TrustVerdict::kUnknown) {
        return verdict;
    }
    content.put(entry);
    content.addHeading();
    if (const auto written = write(change->file, content); !written) {
        return written.error();
    }
    OVRA_NOTICE("The key [%s] of [%s] is trusted from now on", entry.value.c_str(),
                entry.endpoint.c_str());
    return content.verdictOn(entry.endpoint, entry.value);
}

TrustVerdict TrustStore::pin(const std::string &endpoint, const std::string &fingerprint) {
    return add({endpoint, fingerprint});
}

TrustVerdict TrustStore::vouch(const std::string &endpoint) {
    return add({endpoint, kSystem});
}

TrustVerdict TrustStore::trust(const std::string &endpoint, const std::string &value,
                               bool replace) {
    if (!isEndpoint(endpoint) || !isValueFor(endpoint, value) || value == kForgotten ||
        !ensureStateDir(OvraBase::folderOf(path_))) {
        return TrustVerdict::kUnavailable;
    }
    auto change = beginChange();
    if (!change) {
        return change.error();
    }
    Content &content = change->content;
    const TrustVerdict before = content.verdictOn(endpoint, value);
    if (before == TrustVerdict::kTrusted || (before == TrustVerdict::kDifferent && !replace)) {
        return before;
    }
    if (content.isGone) {
        content.lines.emplace_back(std::string(kLostLine)); // what else it held is still unknown
    }
    content.put({endpoint, value});
    content.addHeading();
    if (const auto written = write(change->file, content); !written) {
        return written.error();
    }
    OVRA_NOTICE("A person trusts the key [%s] of [%s] from now on", value.c_str(),
                endpoint.c_str());
    return TrustVerdict::kTrusted;
}

bool TrustStore::undoTrust(const std::string &endpoint, const std::string &value,
                           const std::optional<Entry> &before) {
    auto change = beginChange();
    if (!change) {
        return false;
    }
    Content &content = change->content;
    const auto line = content.find(endpoint);
    if (line == content.lines.end() || line->entry.value != value) {
        return true;
    }
    if (before) {
        content.put(*before);
    } else {
        content.remove(endpoint);
    }
    if (!write(change->file, content)) {
        return false;
    }
    OVRA_NOTICE("The key [%s] of [%s] is not trusted after all", value.c_str(), endpoint.c_str());
    return true;
}

bool TrustStore::forget(const std::string &endpoint) {
    if (auto known = read(); known && known->find(endpoint) == known->lines.end()) {
        return true; // also where there is no folder yet
    }
    auto change = beginChange();
    if (!change) {
        return false;
    }
    Content &content = change->content;
    if (content.find(endpoint) == content.lines.end()) {
        return true;
    }
    content.put({endpoint, kForgotten});
    if (content.problem.empty()) {
        content.addHeading();
    }
    if (!write(change->file, content)) {
        return false;
    }
    OVRA_NOTICE("The key of [%s] is not trusted any more", endpoint.c_str());
    return true;
}

std::optional<TrustStore::Entry> TrustStore::find(const std::string &endpoint) const {
    auto content = read();
    if (!content) {
        return std::nullopt;
    }
    const auto line = content->find(endpoint);
    return line == content->lines.end() ? std::nullopt : std::optional(line->entry);
}

std::optional<std::vector<TrustStore::Entry>> TrustStore::list() const {
    const auto content = read();
    if (!content) {
        return std::nullopt;
    }
    std::unordered_map<std::string, std::int64_t> since; // by tag
    for (const Line &line : content->lines) {
        const std::size_t tag = line.text.find(' ', kSince.size());
        if (line.tellsSince() && tag != std::string::npos) {
            const std::string_view seconds(line.text.data() + kSince.size(), tag - kSince.size());
            since[line.text.substr(tag)] =
                OvraBase::parseNumber<std::int64_t>(seconds, 0).value_or(0);
        }
    }
    std::vector<Entry> entries;
    std::unordered_set<std::string> told;
    for (const Line &line : content->lines) {
        if (line.says() && line.isSound() && told.insert(line.entry.endpoint).second) {
            entries.push_back(line.entry);
            const auto noted = since.find(sinceTag(line.entry));
            entries.back().since = noted == since.end() ? 0 : noted->second;
        }
    }
    return entries;
}

TrustStore::Stamp TrustStore::stamp() const {
    struct stat status {};
    if (stat(path_.c_str(), &status) != 0) {
        return {};
    }
    return {status.st_dev, status.st_ino, nanoseconds(status.st_mtim), nanoseconds(status.st_ctim),
            status.st_size};
}

} // namespace OvraPlatform
