// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/session_store.h"

#include <ovrabase/address.h>
#include <ovrabase/encoding.h>
#include <ovrabase/secret.h>
#include <ovradrcore/json.h>

#include <json/value.h>
#include <sodium.h>

#include <array>
#include <ctime>
#include <utility>

namespace OvraPlatform {

namespace {

constexpr std::size_t kIdBytes = 32;
constexpr std::size_t kReferenceBytes = 8;

// "OvSe". The key of a session is the SHA-256 of its id: looking it up in the index takes a time
// that depends on the hash, from which no id can be built up digit by digit.
//
// With its indexes and its count, layout 2 lets nothing look at every session. The partial indexes
// cost a session that never ends nothing.
constexpr DatabaseLayout kLayout = {"session store", 0x4F765365, 2, R"(
    CREATE TABLE session (
        key     BLOB PRIMARY KEY,
        id      TEXT NOT NULL,
        user    TEXT NOT NULL,
        app     TEXT,
        extra   TEXT,
        ui      TEXT,
        remote  TEXT,
        created INTEGER NOT NULL,
        expires INTEGER
    ) STRICT, WITHOUT ROWID;
    CREATE INDEX session_user ON session (user);
    CREATE INDEX session_expires ON session (expires) WHERE expires IS NOT NULL;
)",
                                    R"(
    DROP INDEX session_user;
    CREATE INDEX session_owner ON session (user, app, extra);
    CREATE INDEX session_timed ON session (user) WHERE expires IS NOT NULL;
    CREATE INDEX session_created ON session (created) WHERE expires IS NOT NULL;
    CREATE TABLE tally (sessions INTEGER NOT NULL) STRICT;
    INSERT INTO tally SELECT count(*) FROM session;
    CREATE TRIGGER session_made AFTER INSERT ON session
        BEGIN UPDATE tally SET sessions = sessions + 1; END;
    CREATE TRIGGER session_removed AFTER DELETE ON session
        BEGIN UPDATE tally SET sessions = sessions - 1; END;
)"};

/// How many sessions a walk holds in memory.
constexpr int kPage = 256;

// ?1 is the time. A timed session made more than a minute in the future was made before the clock
// was set back; nobody knows how long it would live.
#define OVRA_SESSION_LIVE "(expires IS NULL OR (expires > ?1 AND created <= ?1 + 60))"
#define OVRA_SESSION_COLUMNS "id, user, app, extra, ui, remote, created, expires"

std::string keyOf(const std::string &id) {
    std::string key(crypto_hash_sha256_BYTES, '\0');
    crypto_hash_sha256(reinterpret_cast<unsigned char *>(key.data()),
                       reinterpret_cast<const unsigned char *>(id.data()), id.size());
    return key;
}

std::string newId() {
    OvraBase::SecretBytes<kIdBytes> bytes;
    randombytes_buf(bytes.data(), bytes.size());
    return OvraBase::toBase64Url(bytes.data(), bytes.size());
}

SessionRecord readRecord(const Statement &row) {
    SessionRecord record;
    record.id = row.text(0);
    record.user = row.text(1);
    record.app = row.text(2);
    record.extra = row.text(3);
    record.ui = row.text(4);
    record.remote = row.text(5);
    record.created = row.number(6);
    if (!row.isNull(7)) {
        record.expires = row.number(7);
    }
    return record;
}

std::string timeText(std::int64_t seconds) {
    const auto time = static_cast<std::time_t>(seconds);
    std::tm parts{};
    std::array<char, 32> text{};
    if (gmtime_r(&time, &parts) == nullptr ||
        std::strftime(text.data(), text.size(), "%Y-%m-%dT%H:%M:%SZ", &parts) == 0) {
        return std::to_string(seconds);
    }
    return text.data();
}

} // namespace

std::string SessionRecord::reference() const {
    const std::string key = keyOf(id);
    std::array<char, 2 * kReferenceBytes + 1> hex{};
    sodium_bin2hex(hex.data(), hex.size(), reinterpret_cast<const unsigned char *>(key.data()),
                   kReferenceBytes);
    return hex.data();
}

std::string SessionRecord::toString() const {
    return "session " + reference() + " of user [" + user + "], app [" + app + "], client [" +
           remote + "], made " + timeText(created) + ", ends " +
           (expires ? timeText(*expires) : std::string("never"));
}

SessionStore::SessionStore(const std::string &path, Clock clock)
    : database_(path, kLayout)
    , clock_(std::move(clock)) {}

bool SessionStore::isData(const std::string &text) {
    Json::Value value;
    return text.size() <= kMaxJsonText && OvraDRCore::fromString(value, text) && value.isObject();
}

std::int64_t SessionStore::now() const {
    return clock_ ? clock_() : std::time(nullptr);
}

bool SessionStore::checkRequest(const SessionRequest &request) {
    if (!OvraBase::sodiumReady()) {
        return database_.fail(
            "The kernel gives no random numbers. Check that this process may call "
            "getrandom or read /dev/urandom.");
    }
    if (request.user.empty() || request.user.size() > kMaxUser) {
        return database_.fail("A session needs a user of 1 to " + std::to_string(kMaxUser) +
                              " bytes.");
    }
    if (request.timeout == 0) {
        return database_.fail("A session of 0 seconds is none: give seconds, or a negative number "
                              "for one that never ends.");
    }
    if (request.app.size() > kMaxApp) {
        return database_.fail("The application of a session has at most " +
                              std::to_string(kMaxApp) + " bytes.");
    }
    for (const std::string *text : {&request.extra, &request.ui}) {
        if (!text->empty() && !isData(*text)) {
            return database_.fail("The data of a session is the text of a JSON object of at most " +
                                  std::to_string(kMaxJsonText) + " bytes.");
        }
    }
    if (!request.remote.empty() && !OvraBase::isNumericAddress(request.remote)) {
        return database_.fail("The client of a session is a numeric address, not [" +
                              request.remote + "].");
    }
    return true;
}

std::optional<std::int64_t> SessionStore::count(const char *sql, const std::string &user) {
    Statement statement = database_.prepare(sql);
    if (!user.empty()) {
        statement.bind(1, user);
    }
    return statement.step() ? std::optional(statement.number(0)) : std::nullopt;
}

bool SessionStore::removeExpired() {
    // The opposite of OVRA_SESSION_LIVE, each half found by its index.
    const std::int64_t time = now();
    return database_.prepare("DELETE FROM session WHERE expires <= ?1").bind(1, time).run() &&
           database_.prepare("DELETE FROM session WHERE expires IS NOT NULL AND created > ?1 + 60")
               .bind(1, time)
               .run();
}

/// Sweeps, ends what must end, and checks the limits; inside the transaction of the insert.
bool SessionStore::makeRoom(const SessionRequest &request) {
    if (!removeExpired()) {
        return false;
    }
    if (!request.keepOthers &&
        !database_.prepare("DELETE FROM session WHERE user = ?1 AND app IS ?2")
             .bind(1, request.user)
             .bindOptional(2, request.app)
             .run()) {
        return false;
    }
    const auto timed = request.timeout < 0
                           ? 0
                           : count("SELECT count(*) FROM session WHERE user = ?1 AND expires IS "
                                   "NOT NULL",
                                   request.user);
    const auto all = count("SELECT sessions FROM tally", {});
    if (!timed || !all) {
        return false;
    }
    if (*timed >= kMaxTimedOfUser) {
        return database_.fail("User [" + request.user + "] has " + std::to_string(*timed) +
                              " sessions that end by themselves, as many as a user may have. "
                              "Remove some of them.");
    }
    if (*all >= kMaxSessions) {
        return database_.fail("The appliance has " + std::to_string(*all) +
                              " sessions, as many as it may have. Remove some of them.");
    }
    return true;
}

bool SessionStore::insert(const SessionRequest &request, const std::string &id) {
    Statement statement = database_.prepare("INSERT INTO session (key, " OVRA_SESSION_COLUMNS
                                            ") VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, "
                                            "?8, ?9)");
    const std::int64_t created = now();
    statement.bindBlob(1, keyOf(id))
        .bind(2, id)
        .bind(3, request.user)
        .bindOptional(4, request.app)
        .bindOptional(5, request.extra)
        .bindOptional(6, request.ui)
        .bindOptional(7, request.remote)
        .bind(8, created);
    if (request.timeout > 0) {
        statement.bind(9, created + request.timeout);
    }
    return statement.run();
}

std::optional<std::string> SessionStore::create(const SessionRequest &request) {
    if (!isOpen()) {
        return std::nullopt;
    }
    database_.clearError();
    if (!checkRequest(request)) {
        return std::nullopt;
    }
    const std::string id = newId();
    Transaction transaction(database_);
    if (!transaction.isOpen() || !makeRoom(request) || !insert(request, id) ||
        !transaction.commit()) {
        return std::nullopt;
    }
    return id;
}

std::optional<SessionRecord> SessionStore::find(const std::string &id) {
    if (!isOpen() || id.size() != kIdLength) {
        return std::nullopt;
    }
    database_.clearError();
    Statement statement = database_.prepare("SELECT " OVRA_SESSION_COLUMNS
                                            " FROM session WHERE key = ?2 AND " OVRA_SESSION_LIVE);
    statement.bind(1, now()).bindBlob(2, keyOf(id));
    if (!statement.step()) {
        return std::nullopt;
    }
    SessionRecord record = readRecord(statement);
    if (record.id.size() != id.size() ||
        sodium_memcmp(record.id.data(), id.data(), id.size()) != 0) {
        return std::nullopt;
    }
    return record;
}

bool SessionStore::list(std::vector<SessionRecord> &sessions) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    Statement statement =
        database_.prepare("SELECT " OVRA_SESSION_COLUMNS " FROM session WHERE " OVRA_SESSION_LIVE
                          " ORDER BY created, key");
    statement.bind(1, now());
    while (statement.step()) {
        sessions.push_back(readRecord(statement));
    }
    return !database_.failed();
}

bool SessionStore::remove(const std::string &id) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    return database_.prepare("DELETE FROM session WHERE key = ?1").bindBlob(1, keyOf(id)).run();
}

bool SessionStore::sweep() {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    return removeExpired();
}

/// The next live sessions in the order of their keys, after this one.
bool SessionStore::readPage(const SessionFilter *filter, const std::string &after, Page &page) {
    constexpr char kAll[] =
        "SELECT " OVRA_SESSION_COLUMNS ", key FROM session WHERE key > ?2 AND " OVRA_SESSION_LIVE
        " ORDER BY key LIMIT ?3";
    constexpr char kFiltered[] =
        "SELECT " OVRA_SESSION_COLUMNS
        ", key FROM session WHERE user = ?4 AND app IS ?5 AND extra IS ?6 AND "
        "key > ?2 AND " OVRA_SESSION_LIVE " ORDER BY key LIMIT ?3";
    Statement statement = database_.prepare(filter == nullptr ? kAll : kFiltered);
    statement.bind(1, now()).bindBlob(2, after).bind(3, std::int64_t{kPage});
    if (filter != nullptr) {
        statement.bind(4, filter->user).bindOptional(5, filter->app).bindOptional(6, filter->extra);
    }
    page.clear();
    while (statement.step()) {
        page.emplace_back(statement.text(8), readRecord(statement));
    }
    return !database_.failed();
}

bool SessionStore::removeIf(const std::function<bool(const SessionRecord &)> &test,
                            const SessionFilter *filter) {
    if (!isOpen()) {
        return false;
    }
    database_.clearError();
    std::vector<std::string> doomed;
    Page page;
    std::string last;
    do {
        if (!readPage(filter, last, page)) {
            return false;
        }
        for (const auto &[key, record] : page) {
            last = key;
            if (test(record)) {
                doomed.push_back(key);
            }
        }
    } while (page.size() == kPage);
    if (doomed.empty()) {
        return true;
    }
    Transaction transaction(database_);
    if (!transaction.isOpen()) {
        return false;
    }
    for (const std::string &key : doomed) {
        if (!database_.prepare("DELETE FROM session WHERE key = ?1").bindBlob(1, key).run()) {
            return false;
        }
    }
    return transaction.commit();
}

} // namespace OvraPlatform
