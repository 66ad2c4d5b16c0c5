// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/appliance.h"
#include "ovraplatform/database.h"
#include "ovraplatform/export.h"

#include <cstdint>
#include <ctime>
#include <functional>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace OvraPlatform {

/// A login session. The id is a secret: its holder acts as the user.
struct OVRAPLATFORM_EXPORT SessionRecord {
    std::string id;
    std::string user;
    std::string app;                     ///< "" if none was given
    std::string extra;                   ///< JSON text, or ""
    std::string ui;                      ///< JSON text, or ""
    std::string remote;                  ///< numeric address of the client, or "" if unknown
    std::int64_t created = 0;            ///< seconds of the system clock
    std::optional<std::int64_t> expires; ///< absent: never

    /// Names the session to people and in logs: 16 hexadecimal digits of the id's SHA-256. It
    /// grants no access.
    std::string reference() const;
    /// One line for people and logs, without the id.
    std::string toString() const;
};

/// The properties of a new session.
struct SessionRequest {
    std::string user;
    std::string app;
    std::string extra;
    std::string ui;
    std::string remote;
    int timeout = 3600;      ///< seconds; negative: never ends; 0 is refused
    bool keepOthers = false; ///< otherwise the user's other sessions of the same app end
};

/// Whose sessions a walk visits.
struct SessionFilter {
    std::string user;
    std::string app;
    std::string extra; ///< byte for byte
};

/// The appliance's login sessions, in a SQLite file that all processes share. Expired sessions are
/// never handed out; they are swept by sweep() and whenever a session is created. If the clock is
/// set back by more than a minute, timed sessions from its future end.
///
/// The cost of one operation, list() and an unfiltered walk apart, does not grow with the number of
/// sessions, nor does the memory that it takes.
///
/// An object holds one connection: short-lived, for one thread, not kept across a fork. Every
/// change is one transaction.
class OVRAPLATFORM_EXPORT SessionStore {
public:
    static constexpr int kMaxTimedOfUser = 512;  ///< that end by themselves
    static constexpr int kMaxSessions = 65536;   ///< of all users
    static constexpr std::size_t kIdLength = 43; ///< base64url (RFC 4648) of 256 bits, no padding
    static constexpr std::size_t kMaxUser = 491;
    static constexpr std::size_t kMaxApp = 255;
    static constexpr std::size_t kMaxJsonText = 4096; ///< of extra and of ui

    using Clock = std::function<std::time_t()>;

    /// Opens the store; creates the file and its folder if missing.
    explicit SessionStore(const std::string &path = kSessionsFile, Clock clock = {});

    bool isOpen() const { return database_.isOpen(); }
    /// Why the last operation failed; "" if it succeeded.
    const std::string &error() const { return database_.error(); }

    /// Whether `text` can be the extra or ui text of a session: a JSON object, not too long.
    static bool isData(const std::string &text);

    /// Creates a session. \return its id, 43 characters (256 random bits); std::nullopt on failure.
    [[nodiscard]] std::optional<std::string> create(const SessionRequest &request);
    /// The live session with this id. The time taken reveals nothing about existing ids.
    std::optional<SessionRecord> find(const std::string &id);
    /// All live sessions, oldest first. \return false on failure.
    [[nodiscard]] bool list(std::vector<SessionRecord> &sessions);
    /// Removes the session with this id. \return false on failure; a missing session counts as
    /// removed.
    [[nodiscard]] bool remove(const std::string &id);
    /// Removes the expired sessions. \return false on failure.
    [[nodiscard]] bool sweep();
    /// Removes together the live sessions for which `test` returns true. The store is not locked
    /// during `test`, which may use it.
    /// \param filter  only these are visited; null: all
    /// \return false on failure; then nothing is removed.
    [[nodiscard]] bool removeIf(const std::function<bool(const SessionRecord &)> &test,
                                const SessionFilter *filter = nullptr);

private:
    using Page = std::vector<std::pair<std::string, SessionRecord>>; ///< by their keys

    std::int64_t now() const;
    [[nodiscard]] bool checkRequest(const SessionRequest &request);
    std::optional<std::int64_t> count(const char *sql, const std::string &user);
    [[nodiscard]] bool readPage(const SessionFilter *filter, const std::string &after, Page &page);
    [[nodiscard]] bool removeExpired();
    [[nodiscard]] bool makeRoom(const SessionRequest &request);
    [[nodiscard]] bool insert(const SessionRequest &request, const std::string &id);

    Database database_;
    Clock clock_;
};

} // namespace OvraPlatform
