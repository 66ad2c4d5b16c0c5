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

/// `text` as a terminal may show it: control characters, marks that turn the direction of writing,
/// line breaks of any kind and bytes that are no UTF-8 are written as escapes.
std::string printable(const std::string &text);

/// How many columns of a terminal a printable text takes.
std::size_t displayWidth(const std::string &text);

/// Rows under headings, in columns that line up. Cells may hold anything: they are made printable.
std::string table(const std::vector<std::string> &headings,
                  const std::vector<std::vector<std::string>> &rows);

/// One line "name: value" a pair, with the values in one column. Pairs without a value are left
/// out.
std::string listing(const std::vector<std::pair<std::string, std::string>> &pairs);

/// A JSON value over several lines, in ASCII.
std::string prettyJson(const Json::Value &value);

/// "2026-01-31 08:00:00 UTC" for seconds since 1970.
std::string timeText(std::int64_t seconds);

/// Tells the outcome: to people the text on standard output, or one sentence and what to do on
/// standard error; to scripts (`json`) one document on standard output either way.
/// \return what the program exits with; kFailed when standard output takes no more.
ExitCode tell(const Outcome &outcome, bool json);

} // namespace Ovradr
