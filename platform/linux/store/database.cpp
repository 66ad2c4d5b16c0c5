// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/database.h"

#include "ovraplatform/appliance.h"

#include <ovrabase/file.h>
#include <ovrabase/sqlite.h>
#include <ovradrcore/log.h>

#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>

namespace OvraPlatform {

namespace {

/// Changes take milliseconds; a process that holds the file longer than this is stuck.
constexpr std::chrono::seconds kBusyTimeout{5};

/// Of SQLite's pages, in bytes (sqlite.org/fileformat.html, 1.3.2).
constexpr off_t kSmallestPage = 512;

const char *adviceFor(int code) {
    switch (code & 0xFF) {
    case SQLITE_CORRUPT:
    case SQLITE_NOTADB:
        return "The file is damaged: move it away, then a new one is made.";
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
        return "Another process holds the file: end it or try again.";
    case SQLITE_FULL:
    case SQLITE_IOERR:
        return "Look for a full or failing disk.";
    case SQLITE_CANTOPEN:
    case SQLITE_PERM:
    case SQLITE_READONLY:
    case SQLITE_AUTH:
        return "Run as the user that owns the file, on a disk that can be written to.";
    default:
        return "Try again; if it stays, move the file away, then a new one is made.";
    }
}

} // namespace

void Statement::Finalize::operator()(sqlite3_stmt *statement) const {
    sqlite3 *const database = sqlite3_db_handle(statement);
    OvraBase::FinalizeSqlite()(statement);
    // The pages hold the secrets of every row near the one that was read, and a connection may be
    // kept for long; the kernel has the file at hand.
    sqlite3_db_release_memory(database);
}

Statement &Statement::bind(int index, std::string_view text) {
    return noteBound(sqlite3_bind_text64(statement_.get(), index,
                                         text.data() == nullptr ? "" : text.data(), text.size(),
                                         SQLITE_TRANSIENT, SQLITE_UTF8));
}

Statement &Statement::bind(int index, std::int64_t number) {
    return noteBound(sqlite3_bind_int64(statement_.get(), index, number));
}

Statement &Statement::bindBlob(int index, std::string_view bytes) {
    return noteBound(
        sqlite3_bind_blob64(statement_.get(), index, bytes.data(), bytes.size(), SQLITE_TRANSIENT));
}

Statement &Statement::bindOptional(int index, std::string_view text) {
    if (text.empty()) {
        return noteBound(sqlite3_bind_null(statement_.get(), index));
    }
    return bind(index, text);
}

Statement &Statement::noteBound(int code) {
    bound_ = bound_ == SQLITE_OK ? code : bound_;
    return *this;
}

bool Statement::isBound() {
    return statement_ != nullptr &&
           (bound_ == SQLITE_OK || database_->failSqlite(bound_, sqlite3_errstr(bound_)));
}

bool Statement::step() {
    if (!isBound()) {
        return false;
    }
    const int code = sqlite3_step(statement_.get());
    if (code != SQLITE_ROW && code != SQLITE_DONE) {
        database_->failSqlite(code);
    }
    return code == SQLITE_ROW;
}

bool Statement::run() {
    if (!isBound()) {
        return false;
    }
    const int code = sqlite3_step(statement_.get());
    return code == SQLITE_DONE || database_->failSqlite(code);
}

std::string Statement::text(int column) const {
    const void *const bytes = sqlite3_column_blob(statement_.get(), column);
    const int size = sqlite3_column_bytes(statement_.get(), column);
    return bytes == nullptr
               ? std::string()
               : std::string(static_cast<const char *>(bytes), static_cast<std::size_t>(size));
}

std::int64_t Statement::number(int column) const {
    return sqlite3_column_int64(statement_.get(), column);
}

bool Statement::isNull(int column) const {
    return sqlite3_column_type(statement_.get(), column) == SQLITE_NULL;
}

void Database::Close::operator()(sqlite3 *database) const {
    const OvraDRCore::NoFork noFork;
    OvraBase::CloseSqlite()(database);
}

Database::Database(std::string path, const DatabaseLayout &layout)
    : path_(std::move(path))
    , layout_(layout) {
    if (path_ != kInMemory && !makeFile()) {
        return;
    }
    const OvraDRCore::NoFork noFork;
    auto opened = OvraBase::openSqlite(path_, 0);
    if (!opened) {
        failSqlite(opened.error().code, opened.error().text);
        return;
    }
    database_.reset(opened->release());
    wait_ = std::make_unique<OvraDRCore::SqliteWait>(database_.get(), kBusyTimeout);
    if (!setUp()) {
        database_.reset();
    }
}

bool Database::refuse(const std::string &sentence) {
    error_ = sentence;
    return false;
}

bool Database::fail(const std::string &sentence) {
    OVRA_ERR("%s", sentence.c_str());
    return refuse(sentence);
}

bool Database::failSqlite(int code) {
    return failSqlite(code, OvraBase::sqliteText(database_.get(), code));
}

bool Database::failSqlite(int code, const std::string &text) {
    return fail("The " + std::string(layout_.name) + " [" + path_ + "] cannot be used: " + text +
                ". " + adviceFor(code));
}

/// The file is created without being opened: closing a descriptor of it would drop the locks that
/// SQLite connections of this process hold on it (fcntl(2), record locks).
bool Database::makeFile() {
    if (!ensureStateDir(OvraBase::folderOf(path_))) {
        error_ = "The folder of the " + std::string(layout_.name) + " [" + path_ +
                 "] cannot be used. Set its owner and mode 0700.";
        return false;
    }
    if (mknod(path_.c_str(), S_IFREG | S_IRUSR | S_IWUSR, 0) != 0 && errno != EEXIST) {
        return fail("The " + std::string(layout_.name) + " [" + path_ + "] cannot be made: " +
                    OvraBase::errnoText(errno) + ". Look for a full or read-only disk.");
    }
    struct stat status {};
    if (lstat(path_.c_str(), &status) != 0 || !S_ISREG(status.st_mode) ||
        status.st_uid != geteuid()) {
        return fail("The " + std::string(layout_.name) + " [" + path_ +
                    "] is not a file of our own user. Remove it.");
    }
    // SQLite would take it for a new one and write over it. The journal of a change that did not
    // end brings back what it was.
    if (status.st_size != 0 && status.st_size < kSmallestPage &&
        access((path_ + "-journal").c_str(), F_OK) != 0) {
        return fail("The " + std::string(layout_.name) + " [" + path_ +
                    "] is damaged: it is too short. Move it away, then a new one is made.");
    }
    if ((status.st_mode & 07777U) != (S_IRUSR | S_IWUSR)) {
        if ((status.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
            OVRA_WARN("The %s [%s] was open to other users; its mode is 0600 again.", layout_.name,
                      path_.c_str());
        }
        if (chmod(path_.c_str(), S_IRUSR | S_IWUSR) != 0) {
            return fail("The mode of [" + path_ + "] cannot be set: " + OvraBase::errnoText(errno) +
                        ". Set it to 0600.");
        }
    }
    return true;
}

std::optional<std::int64_t> Database::pragma(const char *sql) {
    Statement statement = prepare(sql);
    return statement.step() ? std::optional(statement.number(0)) : std::nullopt;
}

bool Database::setUp() {
    // What is deleted, ids and secrets, is overwritten in the file. The end of a change, which is
    // that its journal is removed, is synchronised too: a power failure might bring the journal
    // back, and undo what was acknowledged. One transaction around what is read, because each
    // statement by itself would lock and check the file anew.
    if (!execute("PRAGMA secure_delete = ON; PRAGMA synchronous = EXTRA; BEGIN")) {
        return false;
    }
    const auto version = pragma("PRAGMA user_version");
    const bool named = version && pragma("PRAGMA application_id") == layout_.applicationId;
    if (failed() || !execute("COMMIT")) {
        return false;
    }
    if (version == layout_.version && named) {
        return true;
    }
    const bool older = version == 0 || (named && isPrevious(version));
    if (older && makeTables()) {
        return true;
    }
    if (!failed()) {
        fail("The file [" + path_ + "] is not a " + layout_.name + " that this version knows" +
             (named ? ": it has layout " + std::to_string(version.value_or(0)) + ", not " +
                          std::to_string(layout_.version)
                    : std::string()) +
             ". Install the version that made it, or move it away.");
    }
    return false;
}

bool Database::isPrevious(std::optional<std::int64_t> version) const {
    return layout_.upgrade != nullptr && version == layout_.version - 1;
}

/// Makes the tables in a new file, or upgrades those of the version before.
/// \return false also if the file has another program's tables.
bool Database::makeTables() {
    Transaction transaction(*this);
    if (!transaction.isOpen()) {
        return false;
    }
    const auto version = pragma("PRAGMA user_version");
    const bool named = pragma("PRAGMA application_id") == layout_.applicationId;
    if (version == layout_.version && named) {
        return true; // another process was faster
    }
    const bool upgrades = named && isPrevious(version);
    if (!upgrades && pragma("SELECT count(*) FROM sqlite_schema") != 0) {
        return false;
    }
    const std::string stamp = "PRAGMA application_id = " + std::to_string(layout_.applicationId) +
                              "; PRAGMA user_version = " + std::to_string(layout_.version);
    return (upgrades || execute(layout_.schema)) &&
           (layout_.upgrade == nullptr || execute(layout_.upgrade)) && execute(stamp.c_str()) &&
           transaction.commit();
}

Statement Database::prepare(const char *sql) {
    const OvraDRCore::NoFork noFork;
    sqlite3_stmt *raw = nullptr;
    if (database_ != nullptr) {
        const int code = sqlite3_prepare_v2(database_.get(), sql, -1, &raw, nullptr);
        if (code != SQLITE_OK) {
            failSqlite(code);
        }
    }
    return {this, raw};
}

bool Database::execute(const char *sql) {
    if (database_ == nullptr) {
        return false;
    }
    const OvraDRCore::NoFork noFork;
    const int code = sqlite3_exec(database_.get(), sql, nullptr, nullptr, nullptr);
    return code == SQLITE_OK || failSqlite(code);
}

int Database::changes() const {
    return database_ == nullptr ? 0 : sqlite3_changes(database_.get());
}

void Database::rollback() {
    // After some failures SQLite has rolled back by itself.
    if (database_ != nullptr && sqlite3_get_autocommit(database_.get()) == 0) {
        sqlite3_exec(database_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
    }
}

Transaction::Transaction(Database &database)
    : database_(database)
    , open_(database.execute("BEGIN IMMEDIATE")) {}

Transaction::~Transaction() {
    if (open_) {
        database_.rollback();
    }
}

bool Transaction::commit() {
    if (!open_ || !database_.execute("COMMIT")) {
        return false;
    }
    open_ = false;
    sqlite3_db_release_memory(database_.database_.get()); // of the pages that were changed
    return true;
}

} // namespace OvraPlatform
