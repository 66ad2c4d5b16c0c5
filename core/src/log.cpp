// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/log.h"

#include "ovradrcore/no_fork.h"

#include <syslog.h>
#include <unistd.h>

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

__attribute__((format(printf, 1, 0))) std::string vformat(const char *format, va_list args) {
    va_list measured;
    va_copy(measured, args);
    // NOLINTNEXTLINE(clang-analyzer-valist.Uninitialized): the check does not know va_copy
    const int length = std::vsnprintf(nullptr, 0, format, measured);
    va_end(measured);
    if (length <= 0) {
        return {};
    }
    std::string text(static_cast<std::size_t>(length), '\0');
    std::vsnprintf(text.data(), text.size() + 1, format, args);
    return text;
}

/// Escapes control characters; truncates long text at a character boundary.
std::string oneLine(const std::string &text) {
    std::string line;
    line.reserve(text.size());
    for (std::size_t i = 0; i < text.size(); ++i) {
        const auto c = static_cast<unsigned char>(text[i]);
        if (line.size() >= kMaxMessage && (c & 0xC0U) != 0x80U) {
            line += "... (" + std::to_string(text.size() - i) + " more bytes)";
            break;
        }
        if (c == '\n') {
            line += "\\n";
        } else if (c == '\r') {
            line += "\\r";
        } else if (c == '\t') {
            line += "\\t";
        } else if (c < 0x20 || c == 0x7F) {
            std::array<char, 8> hex{};
            std::snprintf(hex.data(), hex.size(), "\\x%02x", static_cast<unsigned int>(c));
            line += hex.data();
        } else {
            line += text[i];
        }
    }
    return line;
}

} // namespace

void logMessage(LogLevel level, const char *file, int line, const char *function,
                const char *format, ...) {
    va_list args;
    va_start(args, format);
    const std::string message = oneLine(vformat(format, args));
    va_end(args);
    const std::string stem(stemOf(file));
    const NoFork noFork; // syslog(3) has a lock of its own
    syslog(static_cast<int>(level), "%s:%d(%s)[%s][%d]: %s", stem.c_str(), line, function,
           levelWord(level), static_cast<int>(getpid()), message.c_str());
}

} // namespace OvraDRCore
