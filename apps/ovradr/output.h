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

/// The text in lines of at most `width` columns, broken at blanks, each indented by `indent`
/// blanks; no line break at the end. A word that is longer than a line stays whole.
std::string wrapped(const std::string &text, std::size_t width, std::size_t indent);

/// For one run: ids are shown whole, times to the second, and no line is broken (--wide).
void useWideOutput();

/// The id itself, or its first eight characters, usually enough to find it again; whole with
/// --wide.
std::string shortId(const std::string &id);

/// Rows under headings, in aligned columns. Cells may hold anything: they are made printable. What
/// is too long for the terminal is continued below in the last column.
std::string table(const std::vector<std::string> &headings,
                  const std::vector<std::vector<std::string>> &rows);

/// One line "name: value" per pair, with aligned values. Pairs without a value are left out.
std::string listing(const std::vector<std::pair<std::string, std::string>> &pairs);

/// A JSON value over several lines, in ASCII.
std::string prettyJson(const Json::Value &value);

/// "1 session", "3 sessions".
std::string counted(std::size_t number, const std::string &what);

/// With one digit behind the point, for scripts: what is measured is no more exact than that.
double tenths(double number);

/// "3 s", "5 min", "2 h", "4 d"; "" for a negative age.
std::string ageText(double seconds);

/// "5 min ago", "in 2 h" for seconds since 1970; as timeText() with --wide.
std::string whenText(std::int64_t seconds);

/// "2026-01-31 08:00:00 UTC" for seconds since 1970.
std::string timeText(std::int64_t seconds);

/// Reports the outcome: for people the text on standard output, or what was wrong and what to do on
/// standard error; for scripts (`json`) one document on standard output either way.
/// \return the exit code; kFailed if standard output cannot be written.
ExitCode tell(const Outcome &outcome, bool json);

} // namespace Ovradr
