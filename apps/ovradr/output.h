// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <json/value.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace Ovradr {

/// `text` made safe for a terminal: control characters, direction marks, line breaks of any kind
/// and bytes that are not UTF-8 become escapes.
std::string printable(const std::string &text);

/// How many terminal columns a printable text takes.
std::size_t displayWidth(const std::string &text);

/// Rows under headings, in aligned columns. Cells may hold anything: they are made printable.
std::string table(const std::vector<std::string> &headings,
                  const std::vector<std::vector<std::string>> &rows);

/// One line "name: value" per pair, with aligned values. Pairs without a value are left out.
std::string listing(const std::vector<std::pair<std::string, std::string>> &pairs);

/// A JSON value over several lines, in ASCII.
std::string prettyJson(const Json::Value &value);

/// "2026-01-31 08:00:00 UTC" for seconds since 1970.
std::string timeText(std::int64_t seconds);

/// Reports the outcome: for people the text on standard output, or what was wrong and what to do on
/// standard error; for scripts (`json`) one document on standard output either way.
/// \return the exit code; kFailed if standard output cannot be written.
ExitCode tell(const Outcome &outcome, bool json);

} // namespace Ovradr
