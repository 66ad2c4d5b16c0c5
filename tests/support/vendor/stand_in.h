// SPDX-License-Identifier: Apache-2.0
#pragma once

// The inputs of the stand-ins for the vendor's libraries, and what they have recorded. All
// share them with the test; none is thread-safe.

#include <json/value.h>

#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace OvraVendor {

#define OVRA_VENDOR_EXPORT __attribute__((visibility("default")))

/// A request as it arrived at a remote appliance.
struct Call {
    std::string session;
    std::string api;
    std::string method;
    int version = 0;
    Json::Value params;
    bool sealed = false;
    bool reused = false;                ///< may go over a connection that was left open
    long timeout = 0;                   ///< seconds
    std::vector<std::string> uploads{}; ///< "path as name"
};

/// A remote appliance, behind one endpoint.
struct Remote {
    bool reachable = true;
    std::string login = "joe/pw/";    ///< account, password and one-time code that it lets in
    int refusal = 400;                ///< the error for any others
    std::set<std::string> sessions{}; ///< those that live; others are answered with error 119
    std::function<Json::Value(const Call &)> answer{};
    std::vector<Call> calls{};
    int logins = 0;
    int logouts = 0;
};

/// libovracredential.so
struct CredentialLibrary {
    std::map<std::string, Remote> remotes;           ///< by "protocol://host:port"
    std::map<std::string, Json::Value> relay;        ///< what the relay service says of an alias
    int credentials = 0, sessions = 0, requests = 0; ///< that are alive
    /// Asked at each operation, by its name ("probe" for the Process() of one): the error number
    /// with which it fails, if it does.
    std::function<std::optional<int>(const std::string &operation)> fault;
};
inline OVRA_VENDOR_EXPORT CredentialLibrary credentialLibrary;

/// libwebapi-Talo5.so
struct WebApiLibrary {
    /// The local appliance's answer; without it the call fails.
    std::function<Json::Value(const Call &, const std::string &user)> answer;
    int runners = 0; ///< that are alive
};
inline OVRA_VENDOR_EXPORT WebApiLibrary webApiLibrary;

struct Session {
    std::string id, user, app, extra, ui, client;
    int timeout = 0;
};

/// libovracgi.so
struct CgiLibrary {
    std::vector<Session> sessions;
    std::set<int> refusedOptions;
    int handles = 0, records = 0; ///< that are alive
};
inline OVRA_VENDOR_EXPORT CgiLibrary cgiLibrary;

/// libovraw3.so
struct W3Library {
    int http = 5000;
    int https = 5001;
    int clients = 0; ///< that are alive
};
inline OVRA_VENDOR_EXPORT W3Library w3Library;

/// libovracore.so: its files and programs are real ones.
struct CoreLibrary {
    bool readOnly = false; ///< no key can be written
    int streams = 0;       ///< that are open
};
inline OVRA_VENDOR_EXPORT CoreLibrary coreLibrary;

/// libovrasdk.so
struct SdkLibrary {
    std::optional<std::string> serial = "SERIAL1";
    std::optional<std::string> hostName = "appliance";
};
inline OVRA_VENDOR_EXPORT SdkLibrary sdkLibrary;

struct Interface {
    std::string name;
    std::string address;
    bool up = true;
};

/// libovranetsdk.so
struct NetLibrary {
    std::vector<Interface> interfaces;
    std::optional<std::string> pppoe; ///< the first link's address, when it is up
};
inline OVRA_VENDOR_EXPORT NetLibrary netLibrary;

/// How much was not released, or released twice, as text; "" if nothing.
inline std::string leftOver() {
    const std::pair<const char *, int> live[] = {
        {"credential objects", credentialLibrary.credentials},
        {"credential sessions", credentialLibrary.sessions},
        {"credential requests", credentialLibrary.requests},
        {"local runners", webApiLibrary.runners},
        {"session store handles", cgiLibrary.handles},
        {"session records", cgiLibrary.records},
        {"web-engine clients", w3Library.clients},
        {"streams of programs", coreLibrary.streams},
    };
    std::string text;
    for (const auto &[name, count] : live) {
        text += count != 0 ? std::to_string(count) + " " + name + "\n" : "";
    }
    return text;
}

} // namespace OvraVendor
