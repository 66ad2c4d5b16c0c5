// SPDX-License-Identifier: Apache-2.0
#include "host/key_value_file.h"

#include "ovracore/ovracore.h"

#include <ovrabase/file.h>
#include <ovradrcore/log.h>

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace OvraPlatform {

namespace {

constexpr std::string_view kBlanks = " \t\r";

std::string_view trim(std::string_view text) {
    const std::size_t first = text.find_first_not_of(kBlanks);
    if (first == std::string_view::npos) {
        return {};
    }
    return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

/// Where a comment starts, which has a blank before it; the end if there is none.
std::size_t findComment(std::string_view text) {
    for (std::size_t i = 1; i < text.size(); ++i) {
        if (text[i] == '#' && kBlanks.find(text[i - 1]) != std::string_view::npos) {
            return i;
        }
    }
    return text.size();
}

/// The value behind the sign `=`; std::nullopt if it is not well-formed.
std::optional<std::string> parseValue(std::string_view text) {
    const std::size_t first = text.find_first_not_of(kBlanks);
    if (first == std::string_view::npos || text[first] != '"') {
        return std::string(trim(text.substr(0, findComment(text))));
    }
    const std::size_t close = text.find('"', first + 1);
    if (close == std::string_view::npos) {
        return std::nullopt;
    }
    const std::string_view rest = trim(text.substr(close + 1));
    if (!rest.empty() && rest.front() != '#') {
        return std::nullopt;
    }
    return std::string(text.substr(first + 1, close - first - 1));
}

void parseLine(std::string_view text, KeyValueLine &line) {
    const std::string_view content = trim(text);
    if (content.empty() || content.front() == '#') {
        return;
    }
    const std::size_t sign = text.find('=');
    const std::string_view key =
        sign == std::string_view::npos ? std::string_view() : trim(text.substr(0, sign));
    const std::optional<std::string> value =
        key.empty() ? std::nullopt : parseValue(text.substr(sign + 1));
    line.wellFormed = value.has_value();
    if (value) {
        line.key = key;
        line.value = *value;
    }
}

/// `format` with its two %s replaced; std::nullopt if it has other conversions or not just two.
std::optional<std::string> formatLine(std::string_view format, const char *key, const char *value) {
    const char *const arguments[] = {key, value};
    std::size_t used = 0;
    std::string line;
    for (std::size_t i = 0; i < format.size(); ++i) {
        if (format[i] != '%') {
            line += format[i];
        } else if (++i < format.size() && format[i] == '%') {
            line += '%';
        } else if (i < format.size() && format[i] == 's' && used < std::size(arguments)) {
            line += arguments[used++];
        } else {
            return std::nullopt;
        }
    }
    return used == std::size(arguments) ? std::optional(line) : std::nullopt;
}

/// Whether `line` is exactly one line that reads back as this key and value.
bool readsBack(std::string_view line, std::string_view key, std::string_view value) {
    const std::vector<KeyValueLine> lines = parseKeyValueLines(line);
    return lines.size() == 1 && line.back() == '\n' && lines[0].key == key &&
           lines[0].value == value;
}

OvraBase::Expected<void> replaceLine(const std::string &path, std::string_view key,
                                     std::string_view line) {
    const OvraBase::Expected<OvraBase::FileUpdate> update = OvraBase::FileUpdate::begin(path);
    if (!update) {
        return OvraBase::Unexpected(update.error());
    }
    const OvraBase::Expected<std::string> text = OvraBase::readFile(path);
    if (!text && text.error().number != ENOENT) {
        return OvraBase::Unexpected(text.error());
    }
    return update->commit(replaceKeyValue(text.value_or(""), key, line), 0644);
}

} // namespace

std::vector<KeyValueLine> parseKeyValueLines(std::string_view text) {
    std::vector<KeyValueLine> lines;
    for (std::size_t begin = 0; begin < text.size();) {
        KeyValueLine line;
        const std::size_t newline = std::min(text.find('\n', begin), text.size());
        line.begin = begin;
        line.end = std::min(newline + 1, text.size());
        parseLine(text.substr(begin, newline - begin), line);
        begin = line.end;
        lines.push_back(std::move(line));
    }
    return lines;
}

std::optional<std::string> findKeyValue(std::string_view text, std::string_view key) {
    std::optional<std::string> value;
    for (KeyValueLine &line : parseKeyValueLines(text)) {
        if (!line.key.empty() && line.key == key) {
            value = std::move(line.value);
        }
    }
    return value;
}

std::string replaceKeyValue(std::string_view text, std::string_view key, std::string_view line) {
    std::size_t begin = text.size();
    std::size_t end = text.size();
    for (const KeyValueLine &old : parseKeyValueLines(text)) {
        if (!old.key.empty() && old.key == key) {
            begin = old.begin;
            end = old.end;
        }
    }
    std::string result(text.substr(0, begin));
    if (!result.empty() && result.back() != '\n') {
        result += '\n';
    }
    result += line;
    result += text.substr(end);
    return result;
}

} // namespace OvraPlatform

int OLIBCFileExist(const char *path) {
    struct stat status {};
    if (path == nullptr) {
        return 0;
    }
    // What cannot be looked at just now is not missing: a new identity would be made over it.
    return stat(path, &status) == 0 || (errno != ENOENT && errno != ENOTDIR) ? 1 : 0;
}

int OLIBCFileGetKeyValue(const char *path, const char *key, char *buffer, int size, int /*flag*/) {
    if (path == nullptr || key == nullptr || buffer == nullptr || size <= 0) {
        return -1;
    }
    buffer[0] = '\0';
    const OvraBase::Expected<std::string> text = OvraBase::readFile(path);
    if (!text) {
        if (text.error().number != ENOENT) {
            OVRA_ERR("Cannot read [%s]: %s. Make it a readable text file.", path,
                     text.error().text.c_str());
        }
        return -1;
    }
    const std::optional<std::string> value = OvraPlatform::findKeyValue(*text, key);
    if (!value || value->size() >= static_cast<std::size_t>(size) ||
        value->find('\0') != std::string::npos) {
        return -1;
    }
    std::memcpy(buffer, value->c_str(), value->size() + 1);
    return static_cast<int>(value->size());
}

int OLIBCFileSetKeyValue(const char *path, const char *key, const char *value, const char *format) {
    if (path == nullptr || key == nullptr || value == nullptr || format == nullptr) {
        return -1;
    }
    const std::optional<std::string> line = OvraPlatform::formatLine(format, key, value);
    if (!line || !OvraPlatform::readsBack(*line, key, value)) {
        OVRA_ERR("The value for [%s] of [%s] cannot be written so that it reads back. Leave out "
                 "quotes and line breaks.",
                 key, path);
        return -1;
    }
    const OvraBase::Expected<void> changed = OvraPlatform::replaceLine(path, key, *line);
    if (!changed) {
        OVRA_ERR("Cannot change [%s]: %s. Nothing was stored; mend the cause and repeat.", path,
                 changed.error().text.c_str());
        return -1;
    }
    return 0;
}
