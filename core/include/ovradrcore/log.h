// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

namespace OvraDRCore {

/// Levels of a log line; the values are the priorities of syslog(3).
enum class LogLevel { kErr = 3, kWarn = 4, kNotice = 5, kInfo = 6, kDebug = 7 };

/// Writes one line to the system log, with one call of syslog(3): "file:line(function)[LEVEL][pid]:
/// message".
///
/// \param file      source path; the line shows its stem (no folder, no extension)
/// \param line      source line
/// \param function  the function name in the line
/// \param format    as for printf(3). Control and format characters (DEL, U+0080 to U+009F,
///                  and those that turn the direction of writing) and bytes that are not UTF-8 are
///                  escaped, so that one event is one line.
///
///                  A line over 7,000 bytes is truncated and says so.
OVRADRCORE_EXPORT void logMessage(LogLevel level, const char *file, int line, const char *function,
                                  const char *format, ...) __attribute__((format(printf, 5, 6)));

} // namespace OvraDRCore

/// The file name in log lines. A unit that is split into several files defines it before any
/// include, so that all of its lines carry the unit's name.
#ifndef OVRA_LOG_FILE
#define OVRA_LOG_FILE __FILE__
#endif

/// Logs under a given function name, for steps that belong to an operation of another name.
#define OVRA_LOG_IN(level, function, ...)                                                          \
    ::OvraDRCore::logMessage((level), OVRA_LOG_FILE, __LINE__, (function), __VA_ARGS__)
/// The usual macros: the function name is that of the caller.
#define OVRA_LOG(level, ...) OVRA_LOG_IN((level), __func__, __VA_ARGS__)
#define OVRA_ERR(...) OVRA_LOG(::OvraDRCore::LogLevel::kErr, __VA_ARGS__)
#define OVRA_WARN(...) OVRA_LOG(::OvraDRCore::LogLevel::kWarn, __VA_ARGS__)
#define OVRA_NOTICE(...) OVRA_LOG(::OvraDRCore::LogLevel::kNotice, __VA_ARGS__)
#define OVRA_INFO(...) OVRA_LOG(::OvraDRCore::LogLevel::kInfo, __VA_ARGS__)
#define OVRA_DEBUG(...) OVRA_LOG(::OvraDRCore::LogLevel::kDebug, __VA_ARGS__)
