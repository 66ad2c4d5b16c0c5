// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>

namespace OvraTest {

inline constexpr const char *kNodeDatabase = "/usr/ovra/etc/ovradr/node.db";
inline constexpr const char *kIdentityFile = "/usr/ovra/etc/ovradr/node.info";

/// Creates the folders and the node database in the test's sandbox, as set-up would.
void provisionNode();

/// Runs statements on a database without the library.
/// \return the rows, columns joined by '|', rows by '\n'
std::string querySql(const std::string &sql, const char *path = kNodeDatabase);
inline void executeSql(const std::string &sql) {
    querySql(sql);
}

/// Adds a row to a credential table.
void addCred(const std::string &table, const std::string &nodeId, const std::string &credId,
             const std::string &protocol, int port, const std::string &session);

} // namespace OvraTest
