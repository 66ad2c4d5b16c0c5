// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/conn.h"

#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovrawebapi/api_runner.h>

namespace OvraDRNode {

using OvraDRCore::SqliteValueList;

namespace {

/// The HTTPS port; a placeholder in relay endpoints, because a record must have a port.
constexpr int kFarlinkPort = 443;

} // namespace

bool isValidProtocol(const std::string &protocol) {
    return protocol == Word::kHttp || protocol == Word::kHttps || protocol == Word::kFarlink;
}

Conn::Conn(const std::string &addr_, const std::string &protocol_, int port_)
    : addr(addr_)
    , protocol(protocol_)
    , port(port_) {}

Conn Conn::http(const std::string &addr, int port) {
    return {addr, Word::kHttp, port};
}

Conn Conn::https(const std::string &addr, int port) {
    return {addr, Word::kHttps, port};
}

Conn Conn::farlink(const std::string &alias) {
    return {alias, Word::kFarlink, kFarlinkPort};
}

bool Conn::isFarlink() const {
    return protocol == Word::kFarlink;
}

bool Conn::isValid() const {
    if (addr.empty() || !isValidProtocol(protocol)) {
        return false;
    }
    return isFarlink() || OVRA::APIValidator::IsPort(port);
}

bool Conn::operator==(const Conn &other) const {
    return addr == other.addr && port == other.port && protocol == other.protocol;
}

Json::Value Conn::toJson() const {
    Json::Value value(Json::objectValue);
    value[Word::kAddr] = addr;
    value[Word::kProtocol] = protocol;
    value[Word::kPort] = port;
    return value;
}

Conn Conn::fromJson(const Json::Value &value) {
    const bool wellFormed = value.isObject() && value[Word::kAddr].isString() &&
                            value[Word::kProtocol].isString() && value[Word::kPort].isInt();
    if (!wellFormed) {
        OVRA_WARN("Bad Parameter to parse conn: [%s].", OvraDRCore::toLogString(value).c_str());
        return {};
    }
    return {value[Word::kAddr].asString(), value[Word::kProtocol].asString(),
            value[Word::kPort].asInt()};
}

std::vector<std::string> Conn::ListSqliteField() const {
    return {Word::kAddr, Word::kProtocol, Word::kPort};
}

SqliteValueList Conn::ToSqliteValues(const std::vector<std::string> &fields) const {
    SqliteValueList values;
    for (const std::string &field : fields) {
        if (field == Word::kAddr) {
            values.AddValue(field, addr);
        } else if (field == Word::kProtocol) {
            values.AddValue(field, protocol);
        } else if (field == Word::kPort) {
            values.AddValue(field, port);
        }
    }
    return values;
}

bool Conn::FromSqliteValues(const SqliteValueList &row) {
    const bool hasAddr = row.GetValue(Word::kAddr, addr);
    const bool hasProtocol = row.GetValue(Word::kProtocol, protocol);
    const bool hasPort = row.GetValue(Word::kPort, port);
    return hasAddr || hasProtocol || hasPort;
}

} // namespace OvraDRNode
