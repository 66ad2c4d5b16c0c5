// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrnode/conn.h>
#include <ovraplatform/database.h>

#include <cstdint>
#include <ctime>
#include <functional>
#include <string>
#include <vector>

namespace OvraApps {

/// Mode 0600: it holds sessions. docs/files.md describes it.
inline constexpr char kPendingReleasesFile[] = "/usr/ovra/var/ovradr/releases.db";

/// Both nodes' name for a session towards people: 16 hexadecimal digits of its SHA-256. It grants
/// no access.
std::string referenceOf(const std::string &session);

/// A session on another node that is no longer needed but may still exist.
struct PendingRelease {
    std::string session; ///< a secret
    OvraDRNode::Conn conn;
    std::string nodeId;
    std::string credId;       ///< the credential that it came from
    std::int64_t noted = 0;   ///< seconds of the system clock
    int attempts = 0;         ///< failed attempts so far
    std::int64_t nextTry = 0; ///< seconds of the system clock
    int code = 0;             ///< why the last attempt failed; 0: there was none

    std::string reference() const { return referenceOf(session); }
};

/// The releases still to be done, in a SQLite file that all processes share. An object holds one
/// connection: short-lived, for one thread. Every change is one transaction.
class PendingReleases {
public:
    /// How many are remembered. Any more are left to an audit at the other node.
    static constexpr int kMaxReleases = 4096;
    /// How long a release that has just been noted is left to the process that noted it, in
    /// seconds: longer than a flow takes.
    static constexpr int kHold = 600;
    /// The pause after the first failed attempt, in seconds; each further one is twice as long.
    static constexpr int kFirstPause = 30;
    static constexpr int kMaxPause = 6 * 3600;

    using Clock = std::function<std::time_t()>;

    /// Opens the store; creates the file and its folder if missing.
    explicit PendingReleases(const std::string &path = kPendingReleasesFile, Clock clock = {});

    bool isOpen() const { return database_.isOpen(); }
    /// Why the last operation failed; "" if it succeeded.
    const std::string &error() const { return database_.error(); }

    // A note is known by its session and its credential.

    /// Remembers a release before its flow begins, so that a flow that is killed leaves it noted. A
    /// known one gets the new endpoint. \return false on failure, and if there are kMaxReleases
    /// already.
    [[nodiscard]] bool note(const PendingRelease &release);
    /// The release failed once more: it is due again after a pause. \return false on failure.
    [[nodiscard]] bool postpone(const PendingRelease &release, int code);
    /// Removes this note; a missing one counts as removed. \return false on failure.
    [[nodiscard]] bool remove(const PendingRelease &release);
    /// Removes every note of a session. \return false on failure.
    [[nodiscard]] bool forget(const std::string &reference);
    /// All, oldest first. \return false on failure.
    [[nodiscard]] bool list(std::vector<PendingRelease> &releases);
    /// At most `most` of the due ones, the longest due first, including those due later than any
    /// pause allows: the clock was set back. \return false on failure.
    [[nodiscard]] bool listDue(std::vector<PendingRelease> &releases, int most);

private:
    std::int64_t now() const;
    [[nodiscard]] bool collect(OvraPlatform::Statement &rows,
                               std::vector<PendingRelease> &releases);

    OvraPlatform::Database database_;
    Clock clock_;
};

} // namespace OvraApps
