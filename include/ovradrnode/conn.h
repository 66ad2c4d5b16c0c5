// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/export.h"

#include <ovradrcore/sqlite_value.h>

#include <json/value.h>

#include <string>
#include <vector>

namespace OvraDRNode {

/// Whether `protocol` is one of the words "http", "https" and "flk" (relay), exactly.
OVRADRNODE_EXPORT bool isValidProtocol(const std::string &protocol);

/// An endpoint of a node's web API: plain HTTP, HTTPS, or through the relay service. A small value
/// type; nothing is validated before isValid(). Nothing here throws.
class OVRADRNODE_EXPORT Conn final : public OvraDRCore::SqliteRecord {
public:
    /// The listed ones of the columns "addr", "protocol" (text) and "port" (integer).
    OvraDRCore::SqliteValueList
    ToSqliteValues(const std::vector<std::string> &fields) const override;
    /// Loads those of the three columns that the row has; false if it has none.
    [[nodiscard]] bool FromSqliteValues(const OvraDRCore::SqliteValueList &row) override;
    std::vector<std::string> ListSqliteField() const override;

    /// Invalid: no address, no protocol, port -1.
    Conn() = default;
    Conn(const std::string &addr, const std::string &protocol, int port);
    Conn(const Conn &) = default;
    Conn &operator=(const Conn &) = default;

    static Conn http(const std::string &addr, int port);
    static Conn https(const std::string &addr, int port);
    /// The endpoint behind a relay alias; its port, 443, is a placeholder.
    static Conn farlink(const std::string &alias);

    bool isFarlink() const;
    /// An address, a known protocol and, except for a relay endpoint, a port.
    bool isValid() const;

    bool operator==(const Conn &other) const;
    bool operator!=(const Conn &other) const { return !(*this == other); }

    /// Members "addr", "protocol" and "port".
    Json::Value toJson() const;
    /// The endpoint described by `value`; an invalid one, and a WARN line, if a member is missing
    /// or of the wrong type.
    static Conn fromJson(const Json::Value &value);

    /// The endpoints at which this appliance serves: HTTPS and HTTP of every address, then the
    /// relay endpoint if the relay service is enabled. Endpoints that cannot be determined are left
    /// out.
    static std::vector<Conn> listLocal();
    /// `addr` with the appliance's HTTP or HTTPS port.
    static Conn localHttp(const std::string &addr);
    static Conn localHttps(const std::string &addr);
    /// Invalid if the relay service is not enabled.
    static Conn localFarlink();
    /// The direct endpoint behind a relay endpoint, as the credential library names it; any other
    /// endpoint is returned unchanged. Invalid if there is none.
    static Conn translateFarlink(const Conn &conn);

    std::string addr;
    std::string protocol;
    int port = -1;
};

} // namespace OvraDRNode
