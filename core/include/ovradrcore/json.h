// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <json/value.h>

#include <cstddef>
#include <string>
#include <string_view>

namespace OvraDRCore {

/// Renders `value` as compact JSON text (RFC 8259) on one line, in ASCII. Exact but for what JSON
/// cannot hold: a byte that is not UTF-8 becomes U+FFFD, a number that is not finite null.
OVRADRCORE_EXPORT std::string toString(const Json::Value &value);

/// A copy of `value` with login material (passwords, one-time codes, session ids, tokens) replaced
/// by "***", at any depth, also inside a relayed request.
OVRADRCORE_EXPORT Json::Value maskSecrets(const Json::Value &value);

/// toString() of maskSecrets(): what log lines show.
OVRADRCORE_EXPORT std::string toLogString(const Json::Value &value);

/// What a JSON text may make its reader do. The defaults hold for replies: the longest that an
/// appliance sends, a list of 20,000 credentials in 5 MiB, is 160,000 values in 30 MiB.
struct JsonLimits {
    int depth = 200; ///< arrays and objects inside each other; a level costs a few stack frames
    std::size_t values = 262'144; ///< in all: arrays, objects and what is in them
    std::size_t memory = std::size_t{48} * 1024 * 1024; ///< bytes that the tree takes, estimated
};

/// For requests, which carry no lists of that size.
constexpr JsonLimits kRequestLimits{200, 65'536, std::size_t{8} * 1024 * 1024};

enum class JsonFault {
    kNone,
    kNotJson,
    kTooDeep,
    kTooManyValues,
    kTooMuchMemory, ///< or there is none left
};

/// Parses JSON text (RFC 8259, strict: nothing but the grammar, in UTF-8 without half surrogate
/// pairs, and nothing after the document) into `value`. No name twice in an object; a number is a
/// 64-bit integer or fits a double. Takes no more memory than the limits say, whatever the text.
/// \param left  receives what the document leaves of the limits, for others that share them; may
///              be null, or the limits themselves
/// \return the fault, with `value` unchanged, if `text` is not such a document. Never throws.
[[nodiscard]] OVRADRCORE_EXPORT JsonFault parseJson(Json::Value &value, std::string_view text,
                                                    const JsonLimits &limits = {},
                                                    JsonLimits *left = nullptr);

/// What is wrong with a text, for messages: "is not JSON text", "holds too many values", ...
OVRADRCORE_EXPORT const char *describe(JsonFault fault);

/// parseJson() for who need not know the fault.
/// \return false, with `value` unchanged, if there is one. Never throws.
[[nodiscard]] OVRADRCORE_EXPORT bool fromString(Json::Value &value, const std::string &text);

/// Member `key` of `value` if `value` is an object that has it as a string, otherwise "".
OVRADRCORE_EXPORT std::string memberString(const Json::Value &value, const char *key);

} // namespace OvraDRCore
