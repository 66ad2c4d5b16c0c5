// SPDX-License-Identifier: Apache-2.0
#include "json_reader.h"

#include <ovrabase/utf8.h>

#include <algorithm>
#include <charconv>
#include <climits>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <system_error>

namespace OvraDRCore {

namespace {

// What jsoncpp and the C library (glibc, 64 bits) spend on a tree.
/// A value in its array or object: a node of a red-black tree, with the key.
constexpr std::size_t kValueMemory = 96;
/// The tree of an array or object itself.
constexpr std::size_t kTreeMemory = 64;

/// A string's or a name's bytes, with length, end and the allocator's own part.
std::size_t textMemory(std::size_t size) {
    constexpr std::size_t kOverhead = 16;
    constexpr std::size_t kUnit = 16;
    constexpr std::size_t kLeast = 32;
    return std::max(kLeast, (size + kOverhead + kUnit - 1) / kUnit * kUnit);
}

bool isDigit(char c) {
    return c >= '0' && c <= '9';
}

void appendUtf8(std::string &text, char32_t code) {
    const auto append = [&text](char32_t byte) { text += static_cast<char>(byte); };
    if (code < 0x80) {
        append(code);
    } else if (code < 0x800) {
        append(0xC0U | (code >> 6U));
        append(0x80U | (code & 0x3FU));
    } else if (code < 0x10000) {
        append(0xE0U | (code >> 12U));
        append(0x80U | ((code >> 6U) & 0x3FU));
        append(0x80U | (code & 0x3FU));
    } else {
        append(0xF0U | (code >> 18U));
        append(0x80U | ((code >> 12U) & 0x3FU));
        append(0x80U | ((code >> 6U) & 0x3FU));
        append(0x80U | (code & 0x3FU));
    }
}

/// Reads from left to right; every read...() is false at the first byte that is not of the grammar.
class DocumentReader {
public:
    DocumentReader(std::string_view text, JsonLimits &limits)
        : rest_(text)
        , left_(limits) {}

    JsonFault readDocument(Json::Value &value) {
        return readValue(value, 0) && (skipBlanks(), rest_.empty()) ? JsonFault::kNone : fault_;
    }

private:
    bool refuse(JsonFault fault) {
        fault_ = fault;
        return false;
    }

    /// Asked before the memory is taken.
    bool spend(std::size_t memory) {
        return take(left_.memory, memory) || refuse(JsonFault::kTooMuchMemory);
    }
    bool addValue() {
        return (take(left_.values, 1) || refuse(JsonFault::kTooManyValues)) && spend(kValueMemory);
    }
    static bool take(std::size_t &left, std::size_t amount) {
        if (left < amount) {
            return false;
        }
        left -= amount;
        return true;
    }
    bool enter(int depth) {
        return (depth < left_.depth || refuse(JsonFault::kTooDeep)) && spend(kTreeMemory);
    }

    bool startsWith(char c) const { return !rest_.empty() && rest_.front() == c; }

    bool take(char c) {
        const bool found = startsWith(c);
        rest_.remove_prefix(found ? 1 : 0);
        return found;
    }

    bool takeWord(std::string_view word) {
        const bool found = rest_.starts_with(word);
        rest_.remove_prefix(found ? word.size() : 0);
        return found;
    }

    void skipBlanks() {
        while (take(' ') || take('\n') || take('\r') || take('\t')) {
        }
    }

    bool readValue(Json::Value &value, int depth) {
        skipBlanks();
        if (!addValue()) {
            return false;
        }
        switch (rest_.empty() ? '\0' : rest_.front()) {
        case '{':
            return enter(depth) && readObject(value, depth + 1);
        case '[':
            return enter(depth) && readArray(value, depth + 1);
        case '"':
            return readText(value);
        case 't':
            value = true;
            return takeWord("true");
        case 'f':
            value = false;
            return takeWord("false");
        case 'n':
            value = Json::Value();
            return takeWord("null");
        default:
            return readNumber(value);
        }
    }

    bool readText(Json::Value &value) {
        rest_.remove_prefix(1);
        const std::size_t size = plainSize();
        if (size < rest_.size() && rest_[size] == '"') { // as most do: without a copy in between
            if (!spend(textMemory(size))) {
                return false;
            }
            value = Json::Value(rest_.data(), rest_.data() + size);
            rest_.remove_prefix(size + 1);
            return true;
        }
        std::string text;
        if (!readStringEnd(text) || !spend(textMemory(text.size()))) {
            return false;
        }
        value = Json::Value(text);
        return true;
    }

    bool readObject(Json::Value &value, int depth) {
        value = Json::Value(Json::objectValue);
        rest_.remove_prefix(1);
        skipBlanks();
        if (take('}')) {
            return true;
        }
        do {
            skipBlanks();
            std::string name;
            if (!take('"') || !readStringEnd(name) || !spend(textMemory(name.size()))) {
                return false;
            }
            const auto before = value.size();
            Json::Value &member = value[name];
            const bool duplicate = value.size() == before;
            skipBlanks();
            if (duplicate || !take(':') || !readValue(member, depth)) {
                return false;
            }
            skipBlanks();
        } while (take(','));
        return take('}');
    }

    bool readArray(Json::Value &value, int depth) {
        value = Json::Value(Json::arrayValue);
        rest_.remove_prefix(1);
        skipBlanks();
        if (take(']')) {
            return true;
        }
        do {
            if (!readValue(value.append(Json::Value()), depth)) {
                return false;
            }
            skipBlanks();
        } while (take(','));
        return take(']');
    }

    /// What follows the opening quote.
    bool readStringEnd(std::string &text) {
        for (;;) {
            const std::size_t size = plainSize();
            text.append(rest_, 0, size);
            rest_.remove_prefix(size);
            if (take('"')) {
                return true;
            }
            if (!take('\\') || !readEscape(text)) {
                return false;
            }
        }
    }

    /// The size of the characters up to one that ends the string, escapes, or may not be in it.
    std::size_t plainSize() const {
        std::size_t size = 0;
        while (size < rest_.size()) {
            const auto byte = static_cast<unsigned char>(rest_[size]);
            if (byte < 0x20 || byte == '"' || byte == '\\') {
                break;
            }
            const std::size_t character =
                byte < 0x80 ? 1 : OvraBase::firstUtf8(rest_.substr(size)).size;
            if (character == 0) {
                break;
            }
            size += character;
        }
        return size;
    }

    /// What follows a backslash.
    bool readEscape(std::string &text) {
        constexpr std::string_view kLetters = "\"\\/bfnrt";
        constexpr std::string_view kMeanings = "\"\\/\b\f\n\r\t";
        if (take('u')) {
            return readCodePoint(text);
        }
        const std::size_t at = rest_.empty() ? std::string_view::npos : kLetters.find(rest_[0]);
        if (at == std::string_view::npos) {
            return false;
        }
        text += kMeanings[at];
        rest_.remove_prefix(1);
        return true;
    }

    /// The digits after "\u", and the second half of a surrogate pair. Half a pair is no character.
    bool readCodePoint(std::string &text) {
        constexpr char32_t kHigh = 0xD800;
        constexpr char32_t kLow = 0xDC00;
        constexpr char32_t kEnd = 0xE000;
        const auto first = readHex();
        if (!first || (*first >= kLow && *first < kEnd)) {
            return false;
        }
        if (*first < kHigh || *first >= kEnd) {
            appendUtf8(text, *first);
            return true;
        }
        const auto second = takeWord("\\u") ? readHex() : std::nullopt;
        if (!second || *second < kLow || *second >= kEnd) {
            return false;
        }
        appendUtf8(text, 0x10000 + ((*first - kHigh) << 10U) + (*second - kLow));
        return true;
    }

    std::optional<char32_t> readHex() {
        constexpr std::size_t kDigits = 4;
        constexpr int kBase = 16;
        unsigned int number = 0;
        const std::string_view digits = rest_.substr(0, kDigits);
        const auto [end, error] =
            std::from_chars(digits.data(), digits.data() + digits.size(), number, kBase);
        if (error != std::errc() || end != digits.data() + kDigits) {
            return std::nullopt;
        }
        rest_.remove_prefix(kDigits);
        return number;
    }

    bool skipDigits() {
        const std::size_t before = rest_.size();
        while (!rest_.empty() && isDigit(rest_.front())) {
            rest_.remove_prefix(1);
        }
        return rest_.size() < before;
    }

    /// An integer of 64 bits keeps its exact value; every other number has to fit a double, or to
    /// be nearer to zero than any double.
    bool readNumber(Json::Value &value) {
        const char *const start = rest_.data();
        const bool negative = take('-');
        if (!take('0') && !skipDigits()) {
            return false;
        }
        bool whole = true;
        if (take('.')) {
            whole = false;
            if (!skipDigits()) {
                return false;
            }
        }
        if (take('e') || take('E')) {
            whole = false;
            (void)(take('+') || take('-'));
            if (!skipDigits()) {
                return false;
            }
        }
        const char *const end = rest_.data();
        return (whole && convert<Json::LargestInt>(start, end, value)) ||
               (whole && !negative && convert<Json::LargestUInt>(start, end, value)) ||
               convert<double>(start, end, value) || convertTiny({start, end}, value);
    }

    /// A number that is out of the range of a double, as zero unless it is too large.
    static bool convertTiny(std::string_view number, Json::Value &value) {
        const std::size_t exponentAt = std::min(number.find_first_of("eE"), number.size());
        const std::size_t point = std::min(number.find('.'), exponentAt);
        const std::size_t digit = number.find_first_of("123456789");
        std::string_view exponent = number.substr(exponentAt);
        exponent.remove_prefix(std::min(exponent.find_first_of("-0123456789"), exponent.size()));
        int power = 0;
        if (std::from_chars(exponent.data(), exponent.data() + exponent.size(), power).ec ==
            std::errc::result_out_of_range) {
            power = exponent.front() == '-' ? INT_MIN : INT_MAX;
        }
        const auto left = static_cast<std::int64_t>(point) - static_cast<std::int64_t>(digit);
        if (left + power >= 0) { // 10 to a power that is not negative
            return false;
        }
        value = number.front() == '-' ? -0.0 : 0.0;
        return true;
    }

    template <typename Number>
    static bool convert(const char *start, const char *end, Json::Value &value) {
        Number number{};
        if (std::from_chars(start, end, number).ec != std::errc()) {
            return false;
        }
        value = Json::Value(number);
        return true;
    }

    std::string_view rest_;
    JsonLimits &left_;
    JsonFault fault_ = JsonFault::kNotJson;
};

} // namespace

JsonFault readJson(std::string_view text, JsonLimits &limits, Json::Value &value) {
    return DocumentReader(text, limits).readDocument(value);
}

} // namespace OvraDRCore
