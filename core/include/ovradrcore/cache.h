// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <json/value.h>

#include <string>

namespace OvraDRCore {

/// A named JSON value in a cache file that all processes of the appliance share, with a lifetime,
/// which refreshes itself through GetUpdatedData().
///
/// Every operation opens the file, does its work and closes it. An update is atomic between
/// processes and survives the death of the process at any instruction; a read takes no lock. A
/// directory or file that is damaged, or not ours alone, reads as holding nothing; the library then
/// goes on without a cache. Format, limits and recovery: docs/files.md.
///
/// Refreshing: an entry that is absent, older than its lifetime, stamped in the future or refused
/// by IsValid() is refreshed by one process at a time. No lock on the file is held meanwhile.
class OVRADRCORE_EXPORT Cache {
public:
    virtual ~Cache();
    /// A short description of the entry: "name" and one identifying member.
    virtual Json::Value GetInfo() const = 0;
    /// The value when nothing usable is stored and none can be fetched; null here.
    virtual Json::Value GetDefaultValue() const;
    /// Fetches a fresh value into `value`; false: there is none, and what is stored must stay.
    [[nodiscard]] virtual bool GetUpdatedData(Json::Value &value) const = 0;
    /// Whether a stored value is usable.
    virtual bool IsValid(const Json::Value &value) const = 0;
    /// A further reason to refresh a value that is still fresh; false here.
    virtual bool IsNeedUpdate(const Json::Value &value) const;
    /// Whether a reader has to have fresh data while another process fetches it: true, it waits for
    /// that process and takes its result; false, it takes the stored value at once (and waits only
    /// when nothing is stored). Here: the `flag` of the constructor.
    virtual bool IsUpdatedDataRequired() const;

    /// \param path      the cache file; its directory is made, mode 0700, when missing
    /// \param name      the entry's key in the file
    /// \param lifetime  seconds for which a stored value is fresh
    /// \param flag      what IsUpdatedDataRequired() answers unless it is overridden
    /// \param count     how often a read that meets a write under way is tried again without a lock
    Cache(const std::string &path, const std::string &name, long lifetime, bool flag, int count);
    Cache(const Cache &) = default;
    Cache &operator=(const Cache &) = default;

    /// The current value, refreshed when needed.
    Json::Value Read() const;
    /// The stored value as it is, however old; null when there is none. Sends nothing.
    Json::Value GetCachedData() const;
    /// Seconds since the stored value was taken, or -1 when nothing is stored (or it is stamped in
    /// the future). Sends nothing.
    double GetCachedAge() const;
    /// Seconds for which a stored value is fresh.
    long GetLifetime() const { return lifetime_; }
    /// Fetches now, whatever is stored, and stores the result.
    bool Update() const;
    /// Stores `value` as taken now.
    bool UpdateWithData(const Json::Value &value) const;
    /// Stores `value` as measured from `start` to `end` (seconds of the system clock).
    bool UpdateWithData(const Json::Value &value, long start, long end) const;
    /// Deletes the entry; one that is not there is deleted too.
    bool Remove();

private:
    bool refresh(Json::Value &value) const;

    std::string path_;
    std::string name_;
    long lifetime_;
    bool flag_;
    int count_;
};

} // namespace OvraDRCore
