// SPDX-License-Identifier: Apache-2.0
#include "output.h"

#include <ovrabase/expected.h>
#include <ovrabase/utf8.h>
#include <ovradrcore/json.h>

#include <json/writer.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <clocale>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <cwchar>
#include <numeric>
#include <string_view>

namespace Ovradr {

namespace {

constexpr std::size_t kGap = 2;
constexpr std::size_t kShortId = 8;
constexpr std::size_t kLeastColumn = 20; ///< a narrower one is not worth breaking lines for

bool wide = false; ///< what one run of the program shows; set before it shows anything

/// The columns of the terminal that standard output is; 0 if it is none.
std::size_t terminalWidth() {
    winsize size{};
    return ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 ? size.ws_col : 0;
}

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

void useWideOutput() {
    wide = true;
}

std::string shortId(const std::string &id) {
    return wide ? id : id.substr(0, kShortId);
}

std::string printable(const std::string &text) {
    return OvraBase::shown(text);
}

std::size_t displayWidth(const std::string &text) {
    const UnicodeScope unicode;
    std::size_t width = 0;
    for (std::string_view rest = text; !rest.empty();) {
        const OvraBase::Utf8Character character = OvraBase::firstUtf8(rest);
        const int columns = character.size > 0 ? wcwidth(static_cast<wchar_t>(character.code)) : 1;
        width += columns > 0 ? static_cast<std::size_t>(columns) : 0;
        rest.remove_prefix(std::max<std::size_t>(character.size, 1));
    }
    return width;
}

std::string wrapped(const std::string &text, std::size_t width, std::size_t indent) {
    const std::string margin(indent, ' ');
    std::string lines = margin;
    std::size_t used = indent;
    for (std::size_t at = 0; at < text.size();) {
        const std::size_t end = std::min(text.find(' ', at), text.size());
        const std::string word = text.substr(at, end - at);
        const std::size_t columns = displayWidth(word);
        const bool first = used == indent;
        if (!first && used + 1 + columns > width) {
            lines += "\n" + margin;
            used = indent;
        } else if (!first) {
            lines += " ";
            ++used;
        }
        lines += word;
        used += columns;
        at = end + 1;
    }
    return lines;
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
    const std::size_t column =
        std::accumulate(widths.begin(), widths.end() - 1, kGap * (widths.size() - 1));
    const std::size_t width = wide ? 0 : terminalWidth();
    const bool breaks = width >= column + kLeastColumn && width < column + widths.back();
    std::string text;
    for (auto &cells : lines) {
        if (breaks) {
            cells.back() = wrapped(cells.back(), width, column).substr(column);
        }
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
    builder["enableYAMLCompatibility"] = true; // no space before a colon
    std::string text = Json::writeString(builder, value) + "\n";
    // The writer begins an object or array below its name. Within a string there is no line break.
    for (std::size_t at = 0; (at = text.find(": \n", at)) != std::string::npos; at += 2) {
        text.erase(at + 2, text.find_first_not_of(" \n", at + 2) - at - 2);
    }
    for (std::size_t at = 0; (at = text.find('\x7f', at)) != std::string::npos;) {
        text.replace(at, 1, "\\u007f"); // the one character of ASCII that it leaves to the terminal
    }
    return text;
}

std::string counted(std::size_t number, const std::string &what) {
    return std::to_string(number) + " " + what + (number == 1 ? "" : "s");
}

double tenths(double number) {
    return std::round(number * 10) / 10;
}

std::string ageText(double seconds) {
    struct Unit {
        double seconds;
        const char *name;
    };
    constexpr std::array kUnits = {Unit{86400, "d"}, Unit{3600, "h"}, Unit{60, "min"}};
    if (seconds < 0) {
        return "";
    }
    const auto *const unit =
        std::find_if(kUnits.begin(), kUnits.end(),
                     [seconds](const Unit &each) { return seconds >= 2 * each.seconds; });
    const bool large = unit != kUnits.end();
    return std::to_string(std::lround(large ? seconds / unit->seconds : seconds)) + " " +
           (large ? unit->name : "s");
}

std::string whenText(std::int64_t seconds) {
    const double ago = std::difftime(std::time(nullptr), seconds);
    if (wide) {
        return timeText(seconds);
    }
    return ago < 0 ? "in " + ageText(-ago) : ageText(ago) + " ago";
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
        // At a terminal the reader has it before his eyes.
        const bool shown =
            !failure.text.empty() && isatty(STDOUT_FILENO) != 0 && isatty(STDERR_FILENO) != 0;
        told = put(failure.text, stdout) &&
               put(shown ? ""
                         : "ovradr: " + printable(failure.message) + "\n" +
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
