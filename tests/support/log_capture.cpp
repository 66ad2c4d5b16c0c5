// SPDX-License-Identifier: Apache-2.0
#include "support/log_capture.h"

#include <unistd.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <mutex>

namespace {

std::mutex guard;
std::vector<std::string> *captured = nullptr;

__attribute__((format(printf, 2, 0))) void capture(int priority, const char *format, va_list args) {
    const std::lock_guard<std::mutex> lock(guard);
    if (captured == nullptr) {
        return;
    }
    char text[16384];
    std::vsnprintf(text, sizeof(text), format, args);
    captured->push_back(std::to_string(priority) + " " + text);
}

} // namespace

// The program's own definitions override the C library's, also for the checked variant that the
// compiler may choose.
extern "C" {
__attribute__((format(printf, 2, 3))) void syslog(int priority, const char *format, ...) {
    va_list args;
    va_start(args, format);
    capture(priority, format, args);
    va_end(args);
}
void __syslog_chk(int priority, int flag, const char *format, ...);
__attribute__((format(printf, 3, 4))) void __syslog_chk(int priority, int /*flag*/,
                                                        const char *format, ...) {
    va_list args;
    va_start(args, format);
    capture(priority, format, args);
    va_end(args);
}
}

LogCapture::LogCapture() {
    const std::lock_guard<std::mutex> lock(guard);
    captured = new std::vector<std::string>;
}

LogCapture::~LogCapture() {
    const std::lock_guard<std::mutex> lock(guard);
    delete captured;
    captured = nullptr;
}

std::vector<std::string> LogCapture::lines() const {
    const std::lock_guard<std::mutex> lock(guard);
    return *captured;
}

int LogCapture::count(const std::string &text) const {
    int found = 0;
    for (const std::string &line : lines()) {
        found += line.find(text) != std::string::npos ? 1 : 0;
    }
    return found;
}

int LogCapture::count(const std::string &level, const std::string &file,
                      const std::string &function, const std::string &message) const {
    // "PRIORITY file:line(function)[LEVEL][pid]: message"
    const std::string rest =
        "(" + function + ")[" + level + "][" + std::to_string(getpid()) + "]: " + message;
    int found = 0;
    for (const std::string &line : lines()) {
        const std::size_t end = std::min(line.find('('), line.size());
        found += line.substr(2, line.find(':') - 2) == file && line.substr(end) == rest ? 1 : 0;
    }
    return found;
}

void LogCapture::clear() {
    const std::lock_guard<std::mutex> lock(guard);
    captured->clear();
}
