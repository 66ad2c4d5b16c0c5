// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "appliance.h"
#include "platform/own_files.h"
#include "support/daemon_program.h"
#include "support/misbehaving_server.h"

#include <ovraplatform/appliance.h>

namespace OvraTest {

/// The real ovradrd.
struct Program : DaemonProgram {
    explicit Program(const std::function<void()> &prepare = [] {})
        : DaemonProgram({OVRADRD_PROGRAM}, prepare) {}
};

/// An appliance set up in the test's sandbox, for the real ovradrd.
class TheProgram : public testing::Test {
protected:
    TheProgram() { Appliance::provision(); }
    void configure(const std::string &more = "") const {
        writeFile(OvraPlatform::kConfigFile, "address=\"127.0.0.1\"\nhttp_port=\"" + http +
                                                 "\"\nhttps_port=\"" + https + "\"\n" + more);
    }

    HttpClient client() const { return {std::stoi(https), std::stoi(http)}; }

    const std::string http = std::to_string(unusedPort());
    const std::string https = std::to_string(unusedPort());
    const std::string ready = "ovradrd: ready, https " + https + ", http " + http + "\n";
};

} // namespace OvraTest
