// SPDX-License-Identifier: Apache-2.0
#include "measure.h"

#include <ovradrnode/node_db.h>

#include <sqlite3.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>

namespace OvraBench {

namespace {

constexpr const char *kDatabase = "/usr/ovra/etc/ovradr/node.db";

void check(int result, sqlite3 *db) {
    if (result != SQLITE_OK) {
        std::fprintf(stderr, "sqlite: %s\n", sqlite3_errmsg(db));
        std::exit(1);
    }
}

void provision(int rows) {
    std::filesystem::create_directories("/usr/ovra/etc/ovradr");
    std::filesystem::remove(kDatabase);
    std::ifstream file(OVRA_NODE_SQL);
    const std::string schema(std::istreambuf_iterator<char>(file), {});
    sqlite3 *db = nullptr;
    check(sqlite3_open(kDatabase, &db), db);
    const std::string fill =
        "BEGIN;" + schema +
        "WITH RECURSIVE n(i) AS (SELECT 0 UNION ALL SELECT i + 1 FROM n LIMIT " +
        std::to_string(rows) +
        ") INSERT INTO node_cred SELECT '10.0.0.' || i, 'https', 5001, 'cred-' || i, 'node-' || i, "
        "'session-' || i FROM n; COMMIT";
    check(sqlite3_exec(db, fill.c_str(), nullptr, nullptr, nullptr), db);
    sqlite3_close(db);
}

/// The same query by hand: open, prepare, bind, step, read, close.
void byHand(const std::string &credId) {
    sqlite3 *db = nullptr;
    check(sqlite3_open_v2(kDatabase, &db, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX, nullptr),
          db);
    sqlite3_busy_timeout(db, 20000);
    sqlite3_stmt *statement = nullptr;
    check(sqlite3_prepare_v2(db, "SELECT * FROM node_cred WHERE cred_id = ?", -1, &statement,
                             nullptr),
          db);
    sqlite3_bind_text(statement, 1, credId.data(), static_cast<int>(credId.size()),
                      SQLITE_TRANSIENT);
    std::string values[6];
    if (sqlite3_step(statement) != SQLITE_ROW) {
        std::abort();
    }
    for (int i = 0; i < 6; ++i) {
        values[i] = reinterpret_cast<const char *>(sqlite3_column_text(statement, i));
    }
    sqlite3_finalize(statement);
    sqlite3_close(db);
}

} // namespace

bool benchDb() {
    constexpr int kCalls = 500;
    constexpr int kRounds = 15;
    bool good = true;
    for (const int rows : {10, 100000}) {
        provision(rows);
        const auto next = [rows](int &at) {
            at = (at + 7919) % rows;
            return "cred-" + std::to_string(at);
        };
        const Work ours = [next, at = 0]() mutable {
            OvraDRNode::DRNode node;
            if (!OvraDRNode::DRNodeDB::GetCred(next(at), node)) {
                std::abort();
            }
        };
        const Work floor = [next, at = 0]() mutable { byHand(next(at)); };
        good =
            report("`GetCred`, " + std::to_string(rows) + " rows / sqlite3 by hand, open to close",
                   compare(kCalls, kRounds, ours, floor), 1.3) &&
            good;
    }
    return good;
}

} // namespace OvraBench
