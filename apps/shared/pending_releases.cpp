// SPDX-License-Identifier: Apache-2.0
#include "shared/pending_releases.h"

#include <ovraplatform/session_store.h>

#include <algorithm>
#include <utility>

namespace OvraApps {

using OvraDRNode::Conn;
using OvraPlatform::DatabaseLayout;
using OvraPlatform::Statement;

namespace {

// "OvRl". Since version 2 credentials that share a session have a note each, so that none removes
// another's.
constexpr DatabaseLayout kLayout = {"memory of pending releases", 0x4F76526C, 2,
                                    R"(
    CREATE TABLE release (
        reference TEXT PRIMARY KEY,
        session   TEXT NOT NULL,
        addr      TEXT NOT NULL,
        protocol  TEXT NOT NULL,
        port      INTEGER NOT NULL,
        node_id   TEXT NOT NULL,
        cred_id   TEXT NOT NULL,
        noted     INTEGER NOT NULL,
        attempts  INTEGER NOT NULL,
        next_try  INTEGER NOT NULL,
        code      INTEGER NOT NULL
    ) STRICT, WITHOUT ROWID;
    CREATE INDEX release_next_try ON release (next_try);
)",
                                    R"(
    ALTER TABLE release RENAME TO release_1;
    DROP INDEX release_next_try;
    CREATE TABLE release (
        reference TEXT NOT NULL,
        session   TEXT NOT NULL,
        addr      TEXT NOT NULL,
        protocol  TEXT NOT NULL,
        port      INTEGER NOT NULL,
        node_id   TEXT NOT NULL,
        cred_id   TEXT NOT NULL,
        noted     INTEGER NOT NULL,
        attempts  INTEGER NOT NULL,
        next_try  INTEGER NOT NULL,
        code      INTEGER NOT NULL,
        PRIMARY KEY (reference, cred_id)
    ) STRICT, WITHOUT ROWID;
    INSERT INTO release SELECT * FROM release_1;
    DROP TABLE release_1;
    CREATE INDEX release_next_try ON release (next_try);
)"};

#define OVRA_RELEASE_COLUMNS                                                                       \
    "session, addr, protocol, port, node_id, cred_id, noted, attempts, next_try, code"

PendingRelease readRelease(const Statement &row) {
    PendingRelease release;
    release.session = row.text(0);
    release.conn = Conn(row.text(1), row.text(2), static_cast<int>(row.number(3)));
    release.nodeId = row.text(4);
    release.credId = row.text(5);
    release.noted = row.number(6);
    release.attempts = static_cast<int>(row.number(7));
    release.nextTry = row.number(8);
    release.code = static_cast<int>(row.number(9));
    return release;
}

} // namespace

std::string referenceOf(const std::string &session) {
    OvraPlatform::SessionRecord record;
    record.id = session;
    return record.reference();
}

PendingReleases::PendingReleases(const std::string &path, Clock clock)
    : database_(path, kLayout)
    , clock_(std::move(clock)) {}

std::int64_t PendingReleases::now() const {
    return clock_ ? clock_() : std::time(nullptr);
}

bool PendingReleases::note(const PendingRelease &release) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    OvraPlatform::Transaction transaction(database_);
    Statement count =
        database_.prepare("SELECT count(*) FROM release WHERE reference != ?1 OR cred_id != ?2");
    count.bind(1, release.reference()).bind(2, release.credId);
    if (!transaction.isOpen() || !count.step()) {
        return false;
    }
    if (count.number(0) >= kMaxReleases) {
        return database_.fail("As many releases are pending as may be. Look at `ovradr session "
                              "pending` and forget those whose node is gone.");
    }
    Statement insert = database_.prepare(
        "INSERT INTO release (reference, " OVRA_RELEASE_COLUMNS ") VALUES (?1, ?2, ?3, ?4, ?5, "
        "?6, ?7, ?8, 0, ?9, 0) ON CONFLICT (reference, cred_id) DO UPDATE SET addr = "
        "excluded.addr, "
        "protocol = excluded.protocol, port = excluded.port, next_try = excluded.next_try");
    insert.bind(1, release.reference())
        .bind(2, release.session)
        .bind(3, release.conn.addr)
        .bind(4, release.conn.protocol)
        .bind(5, std::int64_t{release.conn.port})
        .bind(6, release.nodeId)
        .bind(7, release.credId)
        .bind(8, now())
        .bind(9, now() + kHold);
    return insert.run() && transaction.commit();
}

bool PendingReleases::postpone(const PendingRelease &release, int code) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    // The pause is computed in the statement: two processes may fail at the same time.
    Statement update = database_.prepare("UPDATE release SET attempts = attempts + 1, code = ?2, "
                                         "next_try = ?3 + min(?4, ?5 << min(attempts, 20)) "
                                         "WHERE reference = ?1 AND cred_id = ?6");
    update.bind(1, release.reference())
        .bind(2, std::int64_t{code})
        .bind(3, now())
        .bind(4, std::int64_t{kMaxPause})
        .bind(5, std::int64_t{kFirstPause})
        .bind(6, release.credId);
    return update.run();
}

bool PendingReleases::remove(const PendingRelease &release) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    return database_.prepare("DELETE FROM release WHERE reference = ?1 AND cred_id = ?2")
        .bind(1, release.reference())
        .bind(2, release.credId)
        .run();
}

bool PendingReleases::forget(const std::string &reference) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    return database_.prepare("DELETE FROM release WHERE reference = ?1").bind(1, reference).run();
}

bool PendingReleases::collect(Statement &rows, std::vector<PendingRelease> &releases) {
    while (rows.step()) {
        releases.push_back(readRelease(rows));
    }
    return !database_.failed();
}

bool PendingReleases::list(std::vector<PendingRelease> &releases) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    Statement rows =
        database_.prepare("SELECT " OVRA_RELEASE_COLUMNS " FROM release ORDER BY noted, reference");
    return collect(rows, releases);
}

bool PendingReleases::listDue(std::vector<PendingRelease> &releases, int most) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    Statement rows = database_.prepare("SELECT " OVRA_RELEASE_COLUMNS
                                       " FROM release WHERE next_try <= ?1 OR next_try > ?1 + ?2 "
                                       "ORDER BY next_try LIMIT ?3");
    rows.bind(1, now()).bind(2, std::int64_t{kMaxPause}).bind(3, std::int64_t{most});
    return collect(rows, releases);
}

} // namespace OvraApps
