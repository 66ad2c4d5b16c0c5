// SPDX-License-Identifier: Apache-2.0
#include "json_reader.h"

#include <ovrabase/utf8.h>

#include <charconv>
#include <optional>
#include <string>
#include <system_error>

namespace OvraDRCore {

namespace {

/// Arrays and objects inside each other; a level costs a few stack frames.
constexpr int kMaxDepth = 200;

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
class Reader {
public:
    explicit Reader(std::string_view text)
        : rest_(text) {}

    bool readDocument(Json::Value &value) {
        return readValue(value, 0) && (skipBlanks(), rest_.empty());
    }

private:
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
        switch (rest_.empty() ? '\0' : rest_.front()) {
        case '{':
            return depth < kMaxDepth && readObject(value, depth + 1);
        case '[':
            return depth < kMaxDepth && readArray(value, depth + 1);
        case '"': {
            std::string text;
            if (!readString(text)) {
                return false;
            }
            value = Json::Value(text);
            return true;
        }
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
            if (!readString(name)) {
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

    bool readString(std::string &text) {
        if (!take('"')) {
            return false;
        }
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

    /// An integer of 64 bits keeps its exact value; every other number has to fit a double.
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
               convert<double>(start, end, value);
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
};

} // namespace

bool readJson(std::string_view text, Json::Value &value) {
    return Reader(text).readDocument(value);
}

} // namespace OvraDRCore
