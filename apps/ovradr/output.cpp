// SPDX-License-Identifier: Apache-2.0
#include "output.h"

#include <ovrabase/expected.h>
#include <ovradrcore/json.h>

#include <json/writer.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <clocale>
#include <cstdio>
#include <ctime>
#include <cwchar>
#include <cwctype>

namespace Ovradr {

namespace {

constexpr std::size_t kGap = 2;

/// The C library's knowledge of Unicode, for this thread, whatever the user's own locale is.
class UnicodeScope {
public:
    UnicodeScope()
        : before_(uselocale(unicode())) {} // without it, uselocale(nullptr) changes nothing
    UnicodeScope(const UnicodeScope &) = delete;
    UnicodeScope &operator=(const UnicodeScope &) = delete;
    ~UnicodeScope() { uselocale(before_); }

private:
    /// Never freed: every cell of a table needs it, and to make it reads files.
    static locale_t unicode() {
        static const locale_t locale = newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
        return locale;
    }

    locale_t before_;
};

/// One character of a text; `size` 1 and no character for a byte that is no UTF-8.
struct Character {
    wchar_t code = 0;
    std::size_t size = 1;
    bool valid = false;
};

Character characterAt(const std::string &text, std::size_t position) {
    Character found;
    std::mbstate_t state{};
    // Safe for threads, because it has a state of its own. NOLINTNEXTLINE(concurrency-mt-unsafe)
    const auto size = std::mbrtowc(&found.code, &text[position], text.size() - position, &state);
    if (size == 0) { // NUL
        return {0, 1, true};
    }
    if (size <= text.size()) {
        found.size = size;
        found.valid = true;
    }
    return found;
}

/// Characters that are printable by the tables but change how the rest of the line shows: those
/// that turn the direction of writing or separate lines (Unicode 15, general categories Cf, Zl and
/// Zp).
bool isDeceptive(wchar_t code) {
    return code == 0x061C || (code >= 0x200B && code <= 0x200F) ||
           (code >= 0x2028 && code <= 0x202E) || (code >= 0x2060 && code <= 0x206F) ||
           code == 0xFEFF || (code >= 0xE0000 && code <= 0xE007F);
}

std::string hexEscape(const char *prefix, unsigned int number, std::size_t digits) {
    std::array<char, 8> text{};
    const auto end = std::to_chars(text.data(), text.data() + text.size(), number, 16).ptr;
    const std::string hex(text.data(), end);
    return prefix + std::string(hex.size() < digits ? digits - hex.size() : 0, '0') + hex;
}

std::string escaped(const Character &character, unsigned char byte) {
    switch (character.valid ? character.code : 0) {
    case L'\n':
        return "\\n";
    case L'\t':
        return "\\t";
    case L'\r':
        return "\\r";
    default:
        break;
    }
    if (!character.valid || character.code < 0x80) {
        return hexEscape("\\x", byte, 2);
    }
    return hexEscape("\\u", static_cast<unsigned int>(character.code), 4);
}

std::string padded(const std::string &text, std::size_t width) {
    const std::size_t used = displayWidth(text);
    return used < width ? text + std::string(width - used, ' ') : text;
}

std::string line(const std::vector<std::string> &cells, const std::vector<std::size_t> &widths) {
    std::string text;
    for (std::size_t i = 0; i < cells.size(); ++i) {
        text += i + 1 < cells.size() ? padded(cells[i], widths[i] + kGap) : cells[i];
    }
    text.erase(text.find_last_not_of(' ') + 1);
    return text + "\n";
}

Json::Value documentOf(const Outcome &outcome) {
    Json::Value document;
    document["success"] = static_cast<bool>(outcome);
    if (outcome) {
        document["data"] = outcome->data;
        return document;
    }
    const Failure &failure = outcome.error();
    document["error"]["code"] = failure.code;
    document["error"]["name"] = failure.name;
    document["error"]["message"] = failure.message;
    document["error"]["hint"] = failure.hint;
    if (!failure.data.isNull()) {
        document["data"] = failure.data;
    }
    return document;
}

bool put(const std::string &text, FILE *stream) {
    return std::fwrite(text.data(), 1, text.size(), stream) == text.size() &&
           std::fflush(stream) == 0;
}

} // namespace

std::string printable(const std::string &text) {
    const UnicodeScope unicode;
    std::string safe;
    for (std::size_t i = 0; i < text.size();) {
        const Character character = characterAt(text, i);
        const bool shown = character.valid &&
                           std::iswprint(static_cast<std::wint_t>(character.code)) != 0 &&
                           !isDeceptive(character.code);
        safe += shown ? text.substr(i, character.size)
                      : escaped(character, static_cast<unsigned char>(text[i]));
        i += character.size;
    }
    return safe;
}

std::size_t displayWidth(const std::string &text) {
    const UnicodeScope unicode;
    std::size_t width = 0;
    for (std::size_t i = 0; i < text.size();) {
        const Character character = characterAt(text, i);
        const int columns = character.valid ? wcwidth(character.code) : 1;
        width += columns > 0 ? static_cast<std::size_t>(columns) : 0;
        i += character.size;
    }
    return width;
}

std::string table(const std::vector<std::string> &headings,
                  const std::vector<std::vector<std::string>> &rows) {
    std::vector<std::vector<std::string>> lines{headings};
    for (const auto &row : rows) {
        std::vector<std::string> cells;
        std::transform(row.begin(), row.end(), std::back_inserter(cells), printable);
        cells.resize(headings.size());
        lines.push_back(cells);
    }
    std::vector<std::size_t> widths(headings.size(), 0);
    for (const auto &cells : lines) {
        for (std::size_t i = 0; i < cells.size(); ++i) {
            widths[i] = std::max(widths[i], displayWidth(cells[i]));
        }
    }
    std::string text;
    for (const auto &cells : lines) {
        text += line(cells, widths);
    }
    return text;
}

std::string listing(const std::vector<std::pair<std::string, std::string>> &pairs) {
    std::size_t width = 0;
    for (const auto &[name, value] : pairs) {
        width = std::max(width, value.empty() ? 0 : displayWidth(name));
    }
    std::string text;
    for (const auto &[name, value] : pairs) {
        if (!value.empty()) {
            text += padded(name + ":", width + 1 + kGap) + printable(value) + "\n";
        }
    }
    return text;
}

std::string prettyJson(const Json::Value &value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "  ";
    builder["commentStyle"] = "None";
    return Json::writeString(builder, value) + "\n";
}

std::string timeText(std::int64_t seconds) {
    const std::time_t time = seconds;
    std::tm parts{};
    std::array<char, 32> text{};
    if (gmtime_r(&time, &parts) == nullptr ||
        std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M:%S UTC", &parts) == 0) {
        return std::to_string(seconds);
    }
    return text.data();
}

ExitCode tell(const Outcome &outcome, bool json) {
    const ExitCode exit = outcome ? ExitCode::kOk : outcome.error().exit;
    bool told = false;
    if (json) {
        told = put(OvraDRCore::toString(documentOf(outcome)) + "\n", stdout);
    } else if (outcome) {
        told = put(outcome->text, stdout);
    } else {
        const Failure &failure = outcome.error();
        told = put(failure.text, stdout) &&
               put("ovradr: " + printable(failure.message) + "\n" +
                       (failure.hint.empty() ? "" : printable(failure.hint) + "\n"),
                   stderr);
    }
    if (told || exit != ExitCode::kOk) {
        return exit;
    }
    if (errno != EPIPE) { // whoever closed a pipe has read enough
        put("ovradr: The output could not be written: " + OvraBase::errnoText(errno) +
                ".\nMake room, or write it elsewhere.\n",
            stderr);
    }
    return ExitCode::kFailed;
}

} // namespace Ovradr
