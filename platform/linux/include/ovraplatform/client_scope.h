// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"

#include <string>

namespace OvraPlatform {

/// While it lives, `address` is the web client this thread works for, as the login-session library
/// records and reports it. Scopes nest; destroy each in the thread that created it.
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

} // namespace OvraPlatform
