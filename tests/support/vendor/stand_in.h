// SPDX-License-Identifier: Apache-2.0
#pragma once

// The inputs of the stand-ins for the vendor's libraries, and what they have recorded. Each library
// owns its part; none is thread-safe.

#include <json/value.h>

#include <ctime>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace OvraVendor {

#define OVRA_VENDOR_EXPORT __attribute__((visibility("default")))

/// Objects of one kind that the library under test has acquired and has to release.
struct Live {
    int now = 0;
    int ever = 0;
    int misused = 0; ///< given back twice, or used after that

    void obtained() {
        ++now;
        ++ever;
    }
    void givenBack() { --now; }
};

/// A request as it arrived at a remote appliance.
struct Call {
    std::string session;
    std::string api;
    std::string method;
    int version = 0;
    Json::Value params;
    bool sealed = false;
    long timeout = 0; ///< seconds
    std::string uploadName;
    bool reused = false; ///< may go over a connection that was left open
};

/// A remote appliance, behind one endpoint.
struct Remote {
    bool reachable = true;
    int error = 0; ///< the credential library's error number for every request; 0: none
    std::string login = "joe/pw/";    ///< account, password and one-time code that it lets in
    int refusal = 400;                ///< the error for any others
    std::set<std::string> sessions{}; ///< those that live; others are answered with error 119
    std::function<Json::Value(const Call &)> answer{};
    std::vector<Call> calls{};
    int probes = 0;
    int logins = 0;
    int logouts = 0;
};

/// libovracredential.so
struct CredentialLibrary {
    std::map<std::string, Remote> remotes;    ///< by "protocol://host:port"
    std::map<std::string, Json::Value> relay; ///< what the relay service says of an alias
    /// Asked at each operation, by its name ("probe" for the Process() of one): the error number
    /// with which it fails, if it does.
    std::function<std::optional<int>(const std::string &operation)> fault;
    Live credentials, sessions, requests;
};
OVRA_VENDOR_EXPORT CredentialLibrary &credentialLibrary();

/// libwebapi-Talo5.so
struct WebApiLibrary {
    /// The local appliance's answer; without it the call fails.
    std::function<Json::Value(const Call &, const std::string &user)> answer;
    Live runners;
};
OVRA_VENDOR_EXPORT WebApiLibrary &webApiLibrary();

struct Session {
    std::string id, user, app, extra, ui, client;
    int timeout = 0;
    std::time_t ends = 0; ///< 0: never
};

/// libovracgi.so
struct CgiLibrary {
    std::vector<Session> sessions;
    std::set<int> refusedOptions;
    bool broken = false; ///< the store does not open
    Live handles, records;
};
OVRA_VENDOR_EXPORT CgiLibrary &cgiLibrary();

/// libovraw3.so
struct W3Library {
    int http = 5000;
    int https = 5001;
    Live clients;
};
OVRA_VENDOR_EXPORT W3Library &w3Library();

/// libovracore.so: its files and programs are real ones.
struct CoreLibrary {
    bool readOnly = false; ///< no key can be written
    Live streams;
};
OVRA_VENDOR_EXPORT CoreLibrary &coreLibrary();

/// libovrasdk.so
struct SdkLibrary {
    std::optional<std::string> serial = "SERIAL1";
    std::optional<std::string> hostName = "appliance";
};
OVRA_VENDOR_EXPORT SdkLibrary &sdkLibrary();

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
OVRA_VENDOR_EXPORT NetLibrary &netLibrary();

/// Everything that was not released, or released wrongly, as text; "" if nothing.
inline std::string leftOver() {
    std::string text;
    const auto look = [&text](const char *name, const Live &live) {
        if (live.now != 0 || live.misused != 0) {
            text += std::string(name) + ": " + std::to_string(live.now) + " of " +
                    std::to_string(live.ever) + " live, " + std::to_string(live.misused) +
                    " misused\n";
        }
    };
    look("credential objects", credentialLibrary().credentials);
    look("credential sessions", credentialLibrary().sessions);
    look("credential requests", credentialLibrary().requests);
    look("local runners", webApiLibrary().runners);
    look("session store handles", cgiLibrary().handles);
    look("session records", cgiLibrary().records);
    look("web-engine clients", w3Library().clients);
    look("streams of programs", coreLibrary().streams);
    return text;
}

} // namespace OvraVendor
