// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/api_call.h"

#include <json/value.h>

#include <chrono>
#include <cstddef>
#include <optional>
#include <string>

// How a process of this appliance asks the daemon over its Unix socket: one frame each way, a
// length of 4 bytes in network order and that many bytes of JSON text. docs/wire.md describes it.
namespace OvraPlatform {

/// Bound on a frame, either way.
inline constexpr std::size_t kMaxFrame = std::size_t{8} * 1024 * 1024;

using Deadline = std::chrono::steady_clock::time_point;

/// Sends one frame.
/// \param fd    a non-blocking stream socket
/// \param stop  a descriptor that ends the wait once readable; -1: none
/// \return false if the peer is gone, the time is over, or it was told to stop.
[[nodiscard]] bool sendFrame(int fd, const std::string &text, Deadline deadline, int stop = -1);

/// Receives one frame; std::nullopt if it is longer than kMaxFrame or for the reasons of
/// sendFrame().
[[nodiscard]] std::optional<std::string> receiveFrame(int fd, Deadline deadline, int stop = -1);

/// Whether the process at the other end of a connected Unix socket is root's or our own user's.
bool isPeerTrusted(int fd);

std::string toLocalRequest(const LocalCall &call);
/// std::nullopt if the text is not a request.
[[nodiscard]] std::optional<LocalCall> parseLocalRequest(const std::string &text);

} // namespace OvraPlatform
