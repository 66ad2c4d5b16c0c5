// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/log.h"

#include "ovradrcore/no_fork.h"

#include <ovrabase/utf8.h>

#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdarg>
#include <cstdio>
#include <string>
#include <string_view>

namespace OvraDRCore {

namespace {

/// Below the 8 KiB that log daemons accept as one line, with room for the prefix.
constexpr std::size_t kMaxMessage = 7000;

const char *levelWord(LogLevel level) {
    switch (level) {
    case LogLevel::kErr:
        return "ERR";
    case LogLevel::kWarn:
        return "WARN";
    case LogLevel::kNotice:
        return "NOTICE";
    case LogLevel::kInfo:
        return "INFO";
    case LogLevel::kDebug:
        return "DEBUG";
    }
    return "ERR";
}

std::string_view stemOf(std::string_view path) {
    const std::size_t slash = path.find_last_of('/');
    const std::string_view name = slash == std::string_view::npos ? path : path.substr(slash + 1);
    return name.substr(0, name.find('.'));
}

/// The message as one line of at most kMaxMessage bytes and the note that it was truncated,
/// whatever bytes it consists of. \param size  of the whole message; `text` is at least the start
/// that a line can show
std::string oneLine(std::string_view text, std::size_t size) {
    std::string line;
    for (std::size_t done = 0; done < size;) {
        const OvraBase::Utf8Character character = OvraBase::firstUtf8(text.substr(done));
        const std::string next = OvraBase::shown(text.substr(done), character);
        if (line.size() + next.size() > kMaxMessage) {
            return line + "... (" + std::to_string(size - done) + " more bytes)";
        }
        line += next;
        done += std::max<std::size_t>(character.size, 1);
    }
    return line;
}

__attribute__((format(printf, 1, 0))) std::string formatLine(const char *format, va_list args) {
    // A line shows at least one byte for each byte of the message; the last character may need
    // more.
    std::array<char, kMaxMessage + 8> start{};
    const int length = std::vsnprintf(start.data(), start.size(), format, args);
    if (length < 0) {
        return "(a message that is too large)";
    }
    const auto size = static_cast<std::size_t>(length);
    return oneLine({start.data(), std::min(size, start.size() - 1)}, size);
}

} // namespace

void logMessage(LogLevel level, const char *file, int line, const char *function,
                const char *format, ...) {
    va_list args;
    va_start(args, format);
    const std::string message = formatLine(format, args);
    va_end(args);
    const std::string stem(stemOf(file));
    const NoFork noFork; // syslog(3) has a lock of its own
    syslog(static_cast<int>(level), "%s:%d(%s)[%s][%d]: %s", stem.c_str(), line, function,
           levelWord(level), static_cast<int>(getpid()), message.c_str());
}

} // namespace OvraDRCore
