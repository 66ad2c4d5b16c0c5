// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <tl/expected.hpp>

#include <string>

namespace OvraBase {

/// Why something failed.
struct Error {
    std::string text; ///< what was wrong and, where the reader can mend it, what to do; no secret
    int number = 0;   ///< the errno behind it; 0 when there is none
};

/// A value, or why there is none.
template <typename T>
using Expected = tl::expected<T, Error>;
using Unexpected = tl::unexpected<Error>;

/// The C library's words for an errno, e.g. "No such file or directory".
std::string errnoText(int number);

/// The failure of a system call, in the C library's words.
Unexpected systemError(int number);
/// The same for errno, right after the call.
Unexpected lastSystemError();

} // namespace OvraBase
