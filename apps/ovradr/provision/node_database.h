// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "provision/new_file.h"

#include <string>

namespace Ovradr {

/// The node database of this appliance.
std::string nodeDatabasePath();

/// Creates the node database, mode 0600, or checks the existing one. The schema is applied in one
/// transaction, so that a crash leaves an empty file, which the next call fills; a non-empty one is
/// never changed. Refuses another program's file and a schema newer than this program.
[[nodiscard]] Expected<SetUpStep> provisionNodeDatabase(const std::string &path,
                                                        const std::string &schemaFile);

/// Whether the node database can be used; the library itself treats an unreadable database as one
/// without rows.
[[nodiscard]] Expected<void> checkNodeDatabase();

} // namespace Ovradr
