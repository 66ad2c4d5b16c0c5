// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <cstdint>
#include <string_view>

namespace OvraService {

/// The part of a file that a client gets.
struct FilePart {
    enum class Kind { kWhole, kPart, kUnsatisfiable };

    Kind kind = Kind::kWhole;
    std::uint64_t first = 0;
    std::uint64_t length = 0;
};

/// Reads a header "Range" (RFC 9110, 14.1.2 and 14.2): one range of bytes. Anything else is
/// ignored, as a server may, and the client gets the whole file.
/// \param range  "" if the client sent none
FilePart partOf(std::string_view range, std::uint64_t size);

} // namespace OvraService
