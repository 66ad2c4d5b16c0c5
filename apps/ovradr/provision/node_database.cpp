// SPDX-License-Identifier: Apache-2.0
#include "provision/node_database.h"

#include "access.h"

#include <ovrabase/file.h>
#include <ovrabase/sqlite.h>
#include <ovradrnode/node_db.h>
#include <ovraplatform/appliance.h>

#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <optional>

namespace Ovradr {

namespace {

using OvraDRNode::kNodeSchemaVersion;

constexpr int kBusyMilliseconds = 20'000; // as long as the library waits

constexpr const char *kRestore =
    "Correct that, or restore the file from a backup; setup never replaces it.";

/// What the library selects and stores.
constexpr std::array kQueries = {
    "SELECT addr, protocol, port, cred_id, node_id, session FROM node_cred",
    "SELECT addr, protocol, port, cred_id, node_id, session FROM temp_cred",
    "SELECT node_id, app, attr, value FROM node_attr",
};

Refusal unusable(const std::string &path, const std::string &why, const std::string &hint) {
    return failure(ExitCode::kNotSetUp,
                   "The node database " + path + " cannot be used: " + why + ".", hint);
}

Refusal sqliteFailure(const std::string &path, sqlite3 *database) {
    return unusable(path, OvraBase::sqliteText(database, SQLITE_NOMEM), kRestore);
}

Refusal newerSchema(const std::string &path, int version) {
    return unusable(path,
                    "its schema " + std::to_string(version) + " is newer than this program's " +
                        std::to_string(kNodeSchemaVersion),
                    "Install the version of this program that made it, or a newer one.");
}

Refusal foreignDatabase(const std::string &path) {
    return unusable(path, "it is not one that `ovradr setup` made, or it is damaged",
                    "Restore it from a backup, or move it away and run `ovradr setup`.");
}

/// The number that a query gives; std::nullopt if it cannot be run or gives none.
std::optional<int> numberOf(sqlite3 *database, const char *sql) {
    const OvraBase::SqliteStatement statement = OvraBase::prepareSqlite(database, sql);
    if (!statement || sqlite3_step(statement.get()) != SQLITE_ROW ||
        sqlite3_column_type(statement.get(), 0) != SQLITE_INTEGER) {
        return std::nullopt;
    }
    return sqlite3_column_int(statement.get(), 0);
}

bool canPrepare(sqlite3 *database, const char *sql) {
    return OvraBase::prepareSqlite(database, sql) != nullptr;
}

bool execute(sqlite3 *database, const char *sql) {
    return sqlite3_exec(database, sql, nullptr, nullptr, nullptr) == SQLITE_OK;
}

Expected<void> checkSchema(sqlite3 *database, const std::string &path) {
    const auto version = numberOf(database, "SELECT version FROM ovradrcore_db_info");
    if (!version) {
        return foreignDatabase(path);
    }
    if (*version > kNodeSchemaVersion) {
        return newerSchema(path, *version);
    }
    for (const char *query : kQueries) {
        if (*version != kNodeSchemaVersion || !canPrepare(database, query)) {
            return foreignDatabase(path);
        }
    }
    return {};
}

Expected<std::string> readSchema(const std::string &schemaFile) {
    const OvraBase::Expected<std::string> text = OvraBase::readFile(schemaFile);
    if (!text || text->empty()) {
        return failure(ExitCode::kNotSetUp, schemaFile + " cannot be read.",
                       "Install the program again.");
    }
    return *text;
}

/// Fills an empty database; true if it was empty.
Expected<bool> fill(sqlite3 *database, const std::string &path, const std::string &schema) {
    if (!execute(database, "BEGIN IMMEDIATE")) {
        return sqliteFailure(path, database);
    }
    const auto objects = numberOf(database, "SELECT count(*) FROM sqlite_schema");
    if (!objects) {
        return sqliteFailure(path, database);
    }
    const bool empty = *objects == 0;
    if (empty && !execute(database, schema.c_str())) {
        return sqliteFailure(path, database);
    }
    if (const auto done = checkSchema(database, path); !done) {
        return Refusal(done.error()); // closing the database takes everything back
    }
    return execute(database, "COMMIT") ? Expected<bool>(empty) : sqliteFailure(path, database);
}

/// SQLite would create a file readable by others.
Expected<void> touchPrivate(const std::string &path) {
    // Not opened: that would follow a link, or wait for the other end of a FIFO.
    if (mknod(path.c_str(), S_IFREG | 0600, 0) == 0 ? chmod(path.c_str(), 0600) != 0
                                                    : errno != EEXIST) {
        return fileFailure(path, errno);
    }
    struct stat status {};
    if (lstat(path.c_str(), &status) == 0 && !S_ISREG(status.st_mode)) {
        return unusable(path, "it is not a regular file", "Move it away.");
    }
    return makePrivate(path).map([](bool) {});
}

} // namespace

std::string nodeDatabasePath() {
    return std::string(OvraPlatform::kConfigDir) + "/node.db";
}

Expected<SetUpStep> provisionNodeDatabase(const std::string &path, const std::string &schemaFile) {
    const Expected<std::string> schema = readSchema(schemaFile);
    if (!schema) {
        return Refusal(schema.error());
    }
    if (const auto done = touchPrivate(path); !done) {
        return Refusal(done.error());
    }
    const auto database = OvraBase::openSqlite(path, kBusyMilliseconds);
    if (!database) {
        return unusable(path, database.error().text, kRestore);
    }
    const auto filled = fill(database->get(), path, *schema);
    if (!filled) {
        return Refusal(filled.error());
    }
    // The end of the change, and the file's name, stay after a power failure.
    if (const auto synced = OvraBase::syncFolderOf(path); *filled && !synced) {
        return fileFailure(path, synced.error().number);
    }
    return SetUpStep{"node database", *filled,
                     path + ", schema " + std::to_string(kNodeSchemaVersion)};
}

Expected<void> checkNodeDatabase() {
    const std::string path = nodeDatabasePath();
    if (access(path.c_str(), F_OK) != 0 && errno == ENOENT) {
        return failure(ExitCode::kNotSetUp,
                       "This appliance is not set up: it has no node database.",
                       "Run `ovradr setup`.");
    }
    if (auto allowed = checkUser(); !allowed) {
        return allowed;
    }
    if (access(path.c_str(), R_OK | W_OK) != 0) {
        return fileFailure(path, errno);
    }
    auto handler = OvraDRNode::NodeDBHandler::GetHandler();
    const int version = handler.GetSchemaVersion();
    if (version == kNodeSchemaVersion) {
        return {};
    }
    if (version > kNodeSchemaVersion) {
        return newerSchema(path, version);
    }
    return unusable(path, handler.GetErrMsg().asString(),
                    "Run `ovradr setup`, which says what is wrong with it.");
}

} // namespace Ovradr
