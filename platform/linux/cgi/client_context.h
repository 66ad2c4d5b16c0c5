// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "core/export.h"

#include <optional>
#include <string>

namespace OvraPlatform {

/// While it lives, `address` is the web client for which this thread works: what the login-session
/// library records and reports. Scopes nest; they are destroyed in the thread that made them.
class OVRAPLATFORM_EXPORT ClientScope {
public:
    /// \param address  numeric text; anything else counts as "no client"
    explicit ClientScope(std::string address);
    ClientScope(const ClientScope &) = delete;
    ClientScope &operator=(const ClientScope &) = delete;
    ~ClientScope();

private:
    std::string address_;
    const std::string *previous_;
};

/// The numeric address of the web client: the innermost ClientScope of this thread, else the
/// environment variable REMOTE_ADDR (RFC 3875, 4.1.8); nothing when there is neither or when it is
/// not a numeric address.
std::optional<std::string> clientAddress();

/// Whether `text` is a numeric IPv4 or IPv6 address.
bool isNumericAddress(const std::string &text);

} // namespace OvraPlatform
