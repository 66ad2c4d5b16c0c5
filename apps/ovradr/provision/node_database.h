// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "provision/new_file.h"

#include <string>

namespace Ovradr {

/// The schema that node.sql makes and that this program works with.
inline constexpr int kSchemaVersion = 1;

/// The node database of this appliance.
std::string nodeDatabasePath();

/// Makes the node database, mode 0600, or checks the one that is there. The schema is applied in
/// one transaction, so that a crash leaves an empty file, which the next call fills; what holds
/// anything is never changed. Refused: another program's file, and a schema that is newer than this
/// program.
[[nodiscard]] Expected<SetUpStep> provisionNodeDatabase(const std::string &path,
                                                        const std::string &schemaFile);

/// Whether the node database can be used; the library itself reports a database that it cannot read
/// as one without rows.
[[nodiscard]] Expected<void> checkNodeDatabase();

} // namespace Ovradr
