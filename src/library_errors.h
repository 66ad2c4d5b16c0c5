// SPDX-License-Identifier: Apache-2.0
#pragma once

namespace OvraDRNode {

/// The error numbers of the credential library that mean something to the senders; any other one is
/// only passed on.
namespace LibraryError {
inline constexpr int kOutOfMemory = 2; ///< or out of descriptors or threads: nothing about the peer
inline constexpr int kNoPermission = 4;
inline constexpr int kCannotConnect = 5;
inline constexpr int kCertificate = 6;
inline constexpr int kConnectionLost = 9; ///< while the reply was awaited
inline constexpr int kTimedOut = 10;
inline constexpr int kUnanswered = 15; ///< the request was sent, and no answer came in time
} // namespace LibraryError

} // namespace OvraDRNode
