// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/api_call.h"
#include "ovraplatform/export.h"
#include "ovraplatform/role.h"

#include <json/value.h>
#include <tl/expected.hpp>

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace OvraPlatform {

/// Who may call.
enum class APIRight {
    kNone,          ///< anybody, even without a session
    kSession,       ///< any user who is logged in
    kPairing,       ///< a logged-in user who may pair
    kAdministrator, ///< an administrator who is logged in
    kLocal,         ///< a process of this appliance
};

/// Which queue a call runs in. What a call has another appliance call here in return runs in a
/// queue above its own, so that two appliances that call each other never wait for each other's
/// places.
enum class APIQueue {
    kQuick,    ///< answers from this machine alone
    kOutbound, ///< waits for the network, where it asks for quick calls at most
    kTwoWay,   ///< has another appliance make outbound calls, to this one too
    kRelay,    ///< has another appliance make any other call
};

/// On whose behalf a handler runs.
struct APICaller {
    std::string user; ///< empty: nobody is logged in
    Role role = Role::kUser;
    std::string session; ///< the session id; empty for a local caller
    std::string address; ///< the client's address; empty for a local caller
    bool local = false;  ///< a process of this appliance, not a remote client
};

/// Receives the parameters (always an object) and returns a reply document (webapi/api_errors.h).
using APIHandler = std::function<Json::Value(const Json::Value &params, const APICaller &caller)>;

/// Tells the queue of a call from its parameters, which may be anything.
using APIQueueChoice = std::function<APIQueue(const Json::Value &params)>;

/// The web-API handlers of a process, found by API, version and method.
///
/// Filled by one thread first, then used by any number of threads.
class OVRAPLATFORM_EXPORT APIRegistry {
public:
    struct Entry {
        APIRight right;
        APIQueue queue;
        APIHandler handler;
        APIQueueChoice choice; ///< may be empty
    };

    APIRegistry() = default;
    APIRegistry(const APIRegistry &) = delete;
    APIRegistry &operator=(const APIRegistry &) = delete;
    /// Stops hosting the registry if it is hosted; no call may be in progress.
    ~APIRegistry();

    /// Registers a handler; replaces an earlier one under the same names.
    /// \param queue   the highest one that the call may need
    /// \param choice  which one a call needs, if that depends on its parameters
    void add(const std::string &api, int version, const std::string &method, APIRight right,
             APIQueue queue, APIHandler handler, APIQueueChoice choice = {});

    /// One registered method, as a caller sees it.
    struct Method {
        std::string api;
        int version;
        std::string method;
        APIRight right;
        APIQueue queue;
    };
    /// All registered methods, sorted by API, method and version.
    std::vector<Method> methods() const;

    /// The queue of the call. An unregistered call is quick: it is refused at once.
    APIQueue queue(const APICall &call) const;

    /// The refusal of a call for its name or for the rights of its caller, whatever its parameters
    /// are: errors 102, 103, 104 for an unregistered call, 119 and 105 for a caller without the
    /// right; std::nullopt if there is nothing against it.
    [[nodiscard]] std::optional<Json::Value> refusal(const APICall &call,
                                                     const APICaller &caller) const;

    /// Runs the handler of the call and returns its reply. Never throws: the errors of
    /// refusal(), 101 for parameters that are not an object, 100 for a handler that threw or
    /// returned no reply document.
    Json::Value dispatch(const APICall &call, const APICaller &caller) const;

    /// Hosts this registry: OVRA::APIRunner runs the calls of this process in it.
    void host();
    /// The registry hosted by this process, or null.
    static const APIRegistry *hosted();

private:
    using Versions = std::map<int, Entry>;
    using Methods = std::map<std::string, Versions>;

    /// The entry, or the error code for the call.
    [[nodiscard]] tl::expected<const Entry *, int> find(const APICall &call) const;

    std::map<std::string, Methods> apis_;
};

} // namespace OvraPlatform
