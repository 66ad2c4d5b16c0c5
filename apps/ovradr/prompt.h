// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <cstddef>
#include <string>
#include <string_view>

namespace Ovradr {

/// A text that is wiped when it goes. It never grows, so that no copy of it stays behind.
class Secret {
public:
    static constexpr std::size_t kMaxSize = 1024;

    Secret();
    Secret(Secret &&) noexcept = default;
    Secret &operator=(Secret &&) = delete;
    Secret(const Secret &) = delete;
    Secret &operator=(const Secret &) = delete;
    ~Secret();

    /// False when there is no room for it.
    bool append(char c);
    void removeLast();
    /// Valid as long as this object.
    const std::string &get() const { return text_; }
    bool empty() const { return text_.empty(); }

private:
    std::string text_;
};

/// Where a password comes from. Neither: it is asked for on the terminal.
struct PasswordSource {
    std::string file;
    bool fromStdin = false;
};

/// Whether there is somebody to ask: standard input and standard error are a terminal.
bool isInteractive();

/// Gets a password: the first line of the file or of standard input, or what is typed in without
/// echo. An empty one, and one of more than Secret::kMaxSize bytes, is refused.
/// \param question  e.g. "Password of bob"
/// \param twice     a password that is typed in has to be typed in again
Expected<Secret> obtainPassword(const PasswordSource &source, const std::string &question,
                                bool twice);

/// Asks for a secret on the terminal, without echo. Only where isInteractive().
Expected<Secret> askSecret(const std::string &question);

/// Asks a question on the terminal that only "y" or "yes" answers with true. Only where
/// isInteractive().
bool confirm(const std::string &question);

} // namespace Ovradr
