// SPDX-License-Identifier: Apache-2.0
#include "service/byte_range.h"

#include <ovrabase/number.h>

#include <algorithm>

namespace OvraService {

namespace {

constexpr std::string_view kUnit = "bytes=";

} // namespace

FilePart partOf(std::string_view range, std::uint64_t size) {
    const FilePart whole{FilePart::Kind::kWhole, 0, size};
    const std::size_t dash = range.find('-');
    if (!range.starts_with(kUnit) || dash == std::string_view::npos) {
        return whole;
    }
    const std::string_view begin = range.substr(kUnit.size(), dash - kUnit.size());
    const std::string_view end = range.substr(dash + 1);
    const auto first = OvraBase::parseNumber<std::uint64_t>(begin);
    const auto last = OvraBase::parseNumber<std::uint64_t>(end);
    const bool wellFormed = (first || begin.empty()) && (last || end.empty()) && (first || last) &&
                            !(first && last && *last < *first);
    if (!wellFormed) {
        return whole;
    }
    // Without a first byte it means the last ones.
    const std::uint64_t from = first ? *first : size - std::min(*last, size);
    if (from >= size) {
        return {FilePart::Kind::kUnsatisfiable, 0, 0};
    }
    const std::uint64_t to = first && last ? std::min(*last, size - 1) : size - 1;
    return {FilePart::Kind::kPart, from, to - from + 1};
}

} // namespace OvraService
