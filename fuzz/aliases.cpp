// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <ovraplatform/farlink.h>

#include <farlinkd/alias_registry.h>

#include <set>
#include <string>

using Farlinkd::Alias;
using Farlinkd::AliasRegistry;
using OvraFuzz::require;

// A list of aliases is refused, or read whole: no two at one port, none outside the range, and a
// change keeps the others.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    const std::string path = "/tmp/fuzz.aliases";
    OvraFuzz::putFile(path.c_str(), OvraFuzz::textOf(data, size));
    AliasRegistry::Limits limits;
    limits.firstPort = 100;
    limits.lastPort = 110;
    limits.lease = std::chrono::seconds(1000);
    AliasRegistry read(path, limits);
    if (!read.load()) {
        return 0;
    }
    const auto before = read.list();
    std::set<int> ports;
    for (const Alias &alias : before) {
        require(OvraPlatform::isFarlinkAlias(alias.name), "an alias has the form of one");
        require(alias.port >= 100 && alias.port <= 110, "a port within the range");
        require(ports.insert(alias.port).second, "a port of its own");
    }
    const auto enrolled = read.enrol("new-alias", "key", 5);
    if (enrolled) {
        require(enrolled->alias.port >= 100 && enrolled->alias.port <= 110, "a new port in range");
    }
    AliasRegistry again(path, limits);
    require(again.load().has_value(), "what was stored can be read");
    for (const Alias &alias : before) {
        const auto found = again.find(alias.name);
        require(found.has_value(), "every alias is kept");
        require(alias.name == "new-alias" || (found->key == alias.key && found->port == alias.port),
                "as it was");
    }
    return 0;
}
