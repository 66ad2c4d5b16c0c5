// SPDX-License-Identifier: Apache-2.0
#include "support/local_node.h"

#include <sqlite3.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>

namespace OvraTest {

namespace {

int collect(void *out, int columns, char **values, char ** /*names*/) {
    auto &rows = *static_cast<std::string *>(out);
    for (int i = 0; i < columns; ++i) {
        rows += (i == 0 ? "" : "|") + std::string(values[i] != nullptr ? values[i] : "NULL");
    }
    rows += "\n";
    return 0;
}

} // namespace

void provisionNode() {
    std::filesystem::create_directories("/usr/ovra/etc/ovradr");
    std::ifstream file(OVRA_NODE_SQL);
    executeSql(std::string(std::istreambuf_iterator<char>(file), {}));
}

std::string querySql(const std::string &sql, const char *path) {
    sqlite3 *db = nullptr;
    std::string rows;
    char *error = nullptr;
    if (sqlite3_open(path, &db) != SQLITE_OK ||
        sqlite3_exec(db, sql.c_str(), collect, &rows, &error) != SQLITE_OK) {
        std::cerr << "test set-up failed: " << (error != nullptr ? error : "open") << "\n";
        std::abort();
    }
    sqlite3_close(db);
    return rows;
}

void addCred(const std::string &table, const std::string &nodeId, const std::string &credId,
             const std::string &protocol, int port, const std::string &session) {
    executeSql("INSERT INTO " + table + " VALUES ('127.0.0.1', '" + protocol + "', " +
               std::to_string(port) + ", '" + credId + "', '" + nodeId + "', '" + session + "')");
}

} // namespace OvraTest
