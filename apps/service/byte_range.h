// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <cstdint>
#include <string_view>

namespace OvraService {

/// Which part of a file a client gets.
struct FilePart {
    enum class Kind { kWhole, kPart, kUnsatisfiable };

    Kind kind = Kind::kWhole;
    std::uint64_t first = 0;
    std::uint64_t length = 0;
};

/// Reads a header "Range" (RFC 9110, 14.1.2 and 14.2): one range of bytes. Whatever else it may say
/// is passed over, as a server may, and the client gets the whole file.
/// \param range  "" where the client sent none
FilePart partOf(std::string_view range, std::uint64_t size);

} // namespace OvraService
