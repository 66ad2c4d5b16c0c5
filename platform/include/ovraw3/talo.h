// SPDX-License-Identifier: Apache-2.0
#pragma once

// Web-engine client: what the appliance's web server listens on.

namespace ovraw3 {

class __attribute__((visibility("default"))) Talo {
public:
    Talo();
    ~Talo(); // NOLINT(performance-trivially-destructible): the appliance's library exports it

    /// -1 if unknown.
    int GetHttpPort();
    int GetHttpsPort();
};

} // namespace ovraw3
