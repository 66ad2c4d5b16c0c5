// SPDX-License-Identifier: Apache-2.0
#define OVRA_LOG_FILE "conn"

// The endpoints of the local appliance, and the relay.

#include "ovradrnode/conn.h"
#include "words.h"

#include <ovracredential/cred_request.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovradrcore/response.h>
#include <ovranet/ovranet.h>
#include <ovraw3/talo.h>
#include <ovrawebapi/api_runner.h>

#include <array>

namespace OvraDRNode {

namespace {

constexpr int kMaxInterfaces = 32;
constexpr int kSelector = OLIB_NET_SELECT_IPV4 | OLIB_NET_SELECT_IPV6;
constexpr int kPppoeLink = 1;
constexpr int kPppoeUp = 1;

std::string getPPPOEAddr() {
    if (OVRAPPPoECheckStatus(kPppoeLink) != kPppoeUp) {
        return {};
    }
    std::array<char, 1024> buffer{};
    if (OVRAPPPoeNetInfoGet(buffer.data(), static_cast<int>(buffer.size()), 0, 0) != 0) {
        OVRA_ERR("Failed to get addr of PPPOE");
    }
    buffer.back() = '\0';
    return buffer.data();
}

std::vector<std::string> listAddr() {
    std::array<OLIBNetInterface, kMaxInterfaces> table{};
    int count = OLIBNetGetInterfaceInfo(table.data(), kMaxInterfaces, kSelector);
    if (count < 1) {
        OVRA_WARN("No interface is existed");
        count = 0;
    }
    std::vector<std::string> addresses;
    for (int i = 0; i < count && i < kMaxInterfaces; ++i) {
        const OLIBNetInterface &entry = table.at(static_cast<std::size_t>(i));
        if (entry.status == OLIB_NET_STATUS_UP) {
            addresses.emplace_back(entry.address);
        }
    }
    const std::string pppoe = getPPPOEAddr();
    if (!pppoe.empty()) {
        addresses.push_back(pppoe);
    }
    return addresses;
}

void addIfValid(std::vector<Conn> &conns, const Conn &conn) {
    if (conn.isValid()) {
        conns.push_back(conn);
    }
}

} // namespace

std::vector<Conn> Conn::listLocal() {
    std::vector<Conn> conns;
    for (const std::string &address : listAddr()) {
        if (address.empty()) {
            continue;
        }
        addIfValid(conns, localHttps(address));
        addIfValid(conns, localHttp(address));
    }
    addIfValid(conns, localFarlink());
    return conns;
}

Conn Conn::localHttp(const std::string &addr) {
    return http(addr, ovraw3::Talo().GetHttpPort());
}

Conn Conn::localHttps(const std::string &addr) {
    return https(addr, ovraw3::Talo().GetHttpsPort());
}

Conn Conn::localFarlink() {
    Json::Value reply;
    OVRA::APIRunner().Exec(reply, Word::kFarlinkApi, 1, "get", Json::Value(), Word::kLocalUser);
    const OvraDRCore::Response response(reply);
    const Json::Value enabled = response.getDataField("enabled");
    const std::string alias = OvraDRCore::memberString(response.getData(), "server_alias");
    if (!response.isSuccess() || !enabled.isBool() || !enabled.asBool() || alias.empty()) {
        return {};
    }
    return farlink(alias);
}

Conn Conn::translateFarlink(const Conn &conn) {
    if (!conn.isFarlink()) {
        return conn;
    }
    Json::Value info;
    OVRA::CredRequestFarlink::GetConnInfo(conn.addr, info, nullptr);
    const Json::Value &found = info; // a non-const operator[] would add a missing member
    const bool wellFormed = found.isObject() && found["host"].isString() &&
                            found["protocol"].isString() && found["port"].isInt();
    if (!wellFormed) {
        OVRA_ERR("Failed to find info[%s] of farlink[%s]", OvraDRCore::toLogString(found).c_str(),
                 conn.addr.c_str());
        return {};
    }
    return {found["host"].asString(), found["protocol"].asString(), found["port"].asInt()};
}

} // namespace OvraDRNode
