// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string_view>

// What all fuzz targets share. A target defines LLVMFuzzerTestOneInput() and calls require() for
// what must hold for every input; the sanitizers find the rest.

namespace OvraFuzz {

/// Ends the program, which the fuzzer reports with the input, unless `holds`.
inline void require(bool holds, const char *what) {
    if (!holds) {
        std::fprintf(stderr, "does not hold: %s\n", what);
        std::abort();
    }
}

inline std::string_view textOf(const std::uint8_t *data, std::size_t size) {
    return {reinterpret_cast<const char *>(data), size};
}

/// Takes the front of `text` up to the next NUL, and the NUL: inputs of several parts.
inline std::string_view takePart(std::string_view &text) {
    const std::string_view part = text.substr(0, text.find('\0'));
    text.remove_prefix(part.size() == text.size() ? part.size() : part.size() + 1);
    return part;
}

/// Makes `text` the content of a file. The targets run in a sandbox, so /tmp is theirs.
inline void putFile(const char *path, std::string_view text) {
    std::FILE *file = std::fopen(path, "we");
    require(file != nullptr && std::fwrite(text.data(), 1, text.size(), file) == text.size() &&
                std::fclose(file) == 0,
            "a file in the sandbox can be written");
}

} // namespace OvraFuzz

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size);
