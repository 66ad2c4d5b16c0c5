// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string.h>
#include <sys/mman.h>

#include <array>
#include <cerrno>
#include <cstddef>
#include <string>
#include <string_view>
#include <utility>

namespace OvraBase {

/// Overwrites the text (explicit_bzero(3)) and empties it.
inline void wipe(std::string &text) {
    explicit_bzero(text.data(), text.size());
    text.clear();
}

/// Overwrites what the calls that this thread has made have left on its stack, 128 KiB of it.
void wipeStack();

/// Keeps the bytes from being swapped out, as far as RLIMIT_MEMLOCK allows. For good: others may
/// have asked the same for the rest of their pages.
inline void keepInMemory(const void *bytes, std::size_t size) {
    const int error = errno;
    (void)mlock(bytes, size);
    errno = error;
}

/// Text that is wiped on destruction and replacement. It never grows beyond its initial capacity,
/// so that reallocation leaves no copy behind.
class Secret {
public:
    /// Capacity in bytes, enough for any password.
    static constexpr std::size_t kMaxSize = 1024;

    Secret()
        : Secret(std::string_view()) {}
    explicit Secret(std::string_view text) {
        text_.reserve(text.size() > kMaxSize ? text.size() : kMaxSize);
        keepInMemory(text_.data(), text_.capacity());
        text_.assign(text);
    }
    /// Takes the text; `text` is wiped and left empty.
    static Secret take(std::string &text) {
        Secret secret(text);
        wipe(text);
        return secret;
    }
    Secret(const Secret &other)
        : Secret(std::string_view(other.text_)) {}
    Secret(Secret &&other) noexcept { text_.swap(other.text_); }
    Secret &operator=(Secret other) noexcept {
        text_.swap(other.text_);
        return *this;
    }
    ~Secret() { wipe(text_); }

    /// False if the capacity is exhausted.
    [[nodiscard]] bool append(char c) {
        const bool fits = text_.size() < kMaxSize && text_.size() < text_.capacity();
        if (fits) {
            text_ += c;
        }
        return fits;
    }
    void removeLast() {
        if (!text_.empty()) {
            text_.back() = '\0';
            text_.pop_back();
        }
    }
    /// Valid until this object is modified.
    const std::string &get() const { return text_; }
    bool empty() const { return text_.empty(); }

private:
    std::string text_;
};

/// Bytes that are wiped on destruction.
template <std::size_t Size>
struct SecretBytes : std::array<unsigned char, Size> {
    SecretBytes()
        : std::array<unsigned char, Size>{} {
        keepInMemory(this->data(), Size);
    }
    SecretBytes(const SecretBytes &other)
        : std::array<unsigned char, Size>(other) {
        keepInMemory(this->data(), Size);
    }
    SecretBytes &operator=(const SecretBytes &) = default;
    ~SecretBytes() { explicit_bzero(this->data(), Size); }
};

/// Wipes a text owned elsewhere at the end of the scope.
class WipeAtEnd {
public:
    explicit WipeAtEnd(std::string &text)
        : text_(text) {}
    WipeAtEnd(const WipeAtEnd &) = delete;
    WipeAtEnd &operator=(const WipeAtEnd &) = delete;
    ~WipeAtEnd() { wipe(text_); }

private:
    std::string &text_;
};

} // namespace OvraBase
