// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/trust_store.h"

#include <ovrabase/encoding.h>
#include <ovrabase/file.h>
#include <ovradrcore/log.h>

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <utility>

namespace OvraPlatform {

namespace {

/// When the file changed whose damage was logged last, so that a damaged line is logged once, not
/// at every request.
std::atomic<std::int64_t> toldOf{0};

std::int64_t nanoseconds(const timespec &time) {
    constexpr std::int64_t kNanosecondsPerSecond = 1'000'000'000;
    return time.tv_sec * kNanosecondsPerSecond + time.tv_nsec;
}

bool isEndpoint(const std::string &text) {
    const bool protocol = text.starts_with("https://") || text.starts_with("http://");
    return protocol && std::all_of(text.begin(), text.end(), [](char c) { return c > ' '; });
}

} // namespace

/// A line as it is in the file, and its content if it is ours.
struct TrustStore::Line {
    std::string text;
    std::optional<Entry> entry;

    explicit Line(std::string line)
        : text(std::move(line)) {
        const std::size_t blank = text.find(' ');
        if (blank == std::string::npos) {
            return;
        }
        Entry parsed{text.substr(0, blank), text.substr(blank + 1)};
        if (isEndpoint(parsed.endpoint) && OvraBase::isFingerprint(parsed.fingerprint)) {
            entry = std::move(parsed);
        }
    }

    bool isDamaged() const { return !entry && !text.empty() && text.front() != '#'; }
    bool isFor(const std::string &endpoint) const { return entry && entry->endpoint == endpoint; }
};

TrustStore::TrustStore(std::string path)
    : path_(std::move(path)) {}

std::optional<std::vector<TrustStore::Line>> TrustStore::read() const {
    const OvraBase::Expected<std::string> content = OvraBase::readFile(path_);
    if (!content && content.error().number != ENOENT) {
        OVRA_ERR("The trusted keys in [%s] cannot be read (%s): repair the file", path_.c_str(),
                 content.error().text.c_str());
        return std::nullopt;
    }
    const std::string text = content.value_or("");
    std::vector<Line> lines;
    for (std::size_t begin = 0; begin < text.size();) {
        const std::size_t end = std::min(text.find('\n', begin), text.size());
        lines.emplace_back(text.substr(begin, end - begin));
        begin = end + 1;
    }
    const auto damaged = std::count_if(lines.begin(), lines.end(),
                                       [](const Line &line) { return line.isDamaged(); });
    const std::int64_t changed = std::get<2>(stamp());
    if (damaged > 0 && toldOf.exchange(changed) != changed) {
        OVRA_WARN("[%s] has %ld lines that cannot be understood; they count for nothing: correct "
                  "or remove them",
                  path_.c_str(), static_cast<long>(damaged));
    }
    return lines;
}

bool TrustStore::write(const OvraBase::FileUpdate &file, const std::vector<Line> &lines) const {
    std::string text;
    for (const Line &line : lines) {
        text += line.text + '\n';
    }
    const OvraBase::Expected<void> written = text.size() > OvraBase::kMaxTextFile
                                                 ? OvraBase::systemError(EFBIG)
                                                 : file.commit(text, 0600);
    if (!written) {
        OVRA_ERR(
            "The trusted keys in [%s] cannot be written (%s): make room, forget endpoints that "
            "are not used any more, or correct the rights",
            path_.c_str(), written.error().text.c_str());
    }
    return written.has_value();
}

TrustVerdict TrustStore::lookup(const std::string &endpoint, const std::string &fingerprint) const {
    const auto lines = read();
    if (!lines) {
        return TrustVerdict::kUnavailable;
    }
    const auto line = std::find_if(lines->begin(), lines->end(),
                                   [&](const Line &each) { return each.isFor(endpoint); });
    if (line == lines->end()) {
        return TrustVerdict::kUnknown;
    }
    return line->entry->fingerprint == fingerprint ? TrustVerdict::kTrusted
                                                   : TrustVerdict::kDifferent;
}

TrustVerdict TrustStore::pin(const std::string &endpoint, const std::string &fingerprint) {
    if (!isEndpoint(endpoint) || !OvraBase::isFingerprint(fingerprint) ||
        !ensureStateDir(OvraBase::folderOf(path_))) {
        return TrustVerdict::kUnavailable;
    }
    const auto file = OvraBase::FileUpdate::begin(path_);
    if (!file) {
        OVRA_ERR("The trusted keys in [%s] cannot be changed: [%s]", path_.c_str(),
                 file.error().text.c_str());
        return TrustVerdict::kUnavailable;
    }
    const TrustVerdict verdict = lookup(endpoint, fingerprint);
    if (verdict != TrustVerdict::kUnknown) {
        return verdict;
    }
    auto lines = read();
    if (!lines) {
        return TrustVerdict::kUnavailable;
    }
    lines->emplace_back(endpoint + " " + fingerprint);
    if (!write(*file, *lines)) {
        return TrustVerdict::kUnavailable;
    }
    OVRA_NOTICE("The key [%s] of [%s] is trusted from now on", fingerprint.c_str(),
                endpoint.c_str());
    return TrustVerdict::kTrusted;
}

bool TrustStore::forget(const std::string &endpoint) {
    if (access(path_.c_str(), F_OK) != 0 && errno == ENOENT) {
        return true;
    }
    const auto file = OvraBase::FileUpdate::begin(path_);
    if (!file) {
        OVRA_ERR("The trusted keys in [%s] cannot be changed: [%s]", path_.c_str(),
                 file.error().text.c_str());
        return false;
    }
    auto lines = read();
    if (!lines) {
        return false;
    }
    const auto kept = std::remove_if(lines->begin(), lines->end(),
                                     [&](const Line &line) { return line.isFor(endpoint); });
    if (kept == lines->end()) {
        return true;
    }
    lines->erase(kept, lines->end());
    if (!write(*file, *lines)) {
        return false;
    }
    OVRA_NOTICE("The key of [%s] is not trusted any more", endpoint.c_str());
    return true;
}

std::optional<std::vector<TrustStore::Entry>> TrustStore::list() const {
    const auto lines = read();
    if (!lines) {
        return std::nullopt;
    }
    std::vector<Entry> entries;
    for (const Line &line : *lines) {
        const auto same = [&line](const Entry &entry) { return line.isFor(entry.endpoint); };
        if (line.entry && std::none_of(entries.begin(), entries.end(), same)) {
            entries.push_back(*line.entry);
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
