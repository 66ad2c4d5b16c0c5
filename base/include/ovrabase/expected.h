// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <tl/expected.hpp>

#include <string>

namespace OvraBase {

/// Why something failed.
struct Error {
    std::string text; ///< what was wrong and, if the reader can fix it, what to do; no secret
    int number = 0;   ///< the errno behind it; 0 if there is none
};

/// A value, or why there is none.
template <typename T>
using Expected = tl::expected<T, Error>;
using Unexpected = tl::unexpected<Error>;

/// The C library's text for an errno, e.g. "No such file or directory".
std::string errnoText(int number);

/// The failure of a system call, with the C library's text.
Unexpected systemError(int number);
/// The same for errno, right after the call.
Unexpected lastSystemError();

} // namespace OvraBase
