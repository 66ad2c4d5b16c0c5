// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <json/value.h>

#include <string>

namespace OvraDRCore {

/// Renders `value` as compact JSON text (RFC 8259) on one line, in ASCII. Exact but for what JSON
/// cannot hold: a byte that is not UTF-8 becomes U+FFFD, a number that is not finite null.
OVRADRCORE_EXPORT std::string toString(const Json::Value &value);

/// A copy of `value` with login material (passwords, one-time codes, session ids, tokens) replaced
/// by "***", at any depth, also inside a relayed request.
OVRADRCORE_EXPORT Json::Value maskSecrets(const Json::Value &value);

/// toString() of maskSecrets(): what log lines show.
OVRADRCORE_EXPORT std::string toLogString(const Json::Value &value);

/// Parses JSON text (RFC 8259, strict: nothing but the grammar, in UTF-8 without half surrogate
/// pairs, and nothing after the document) into `value`. No name twice in an object, at most 200
/// levels of arrays and objects; a number is a 64-bit integer or fits a double.
/// \return false, with `value` unchanged, if `text` is not such a document. Never throws.
[[nodiscard]] OVRADRCORE_EXPORT bool fromString(Json::Value &value, const std::string &text);

/// Member `key` of `value` if `value` is an object that has it as a string, otherwise "".
OVRADRCORE_EXPORT std::string memberString(const Json::Value &value, const char *key);

} // namespace OvraDRCore
