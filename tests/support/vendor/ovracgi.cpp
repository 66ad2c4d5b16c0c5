// SPDX-License-Identifier: Apache-2.0

// The appliance's store of login sessions, in memory.

#include "stand_in.h"

#include <ovracgi/ovracgi.h>

#include <json-c/json_object.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>

using OvraVendor::cgiLibrary;
using OvraVendor::Session;

struct OvraCgiStore {
    std::map<int, int> numbers;
    std::map<int, std::string> texts;
};

namespace {

constexpr int kHour = 3600;

void recordGone(json_object * /*record*/, void * /*data*/) {
    cgiLibrary().records.givenBack();
}

json_object *recordOf(const Session &session) {
    json_object *record = json_object_new_object();
    const auto put = [record](int field, const std::string &value) {
        if (!value.empty()) {
            json_object_object_add(record, std::to_string(field).c_str(),
                                   json_object_new_string(value.c_str()));
        }
    };
    put(OVRA_CGI_FIELD_USER, session.user);
    put(OVRA_CGI_FIELD_SID, session.id);
    put(OVRA_CGI_FIELD_APP, session.app);
    put(OVRA_CGI_FIELD_EXTRA, session.extra);
    cgiLibrary().records.obtained();
    json_object_set_userdata(record, nullptr, recordGone);
    return record;
}

/// Whether the handle's store is open; removes expired sessions.
bool open(const OvraCgi *handle) {
    if (handle->store == nullptr) {
        return false;
    }
    std::erase_if(cgiLibrary().sessions, [](const Session &session) {
        return session.ends != 0 && session.ends <= std::time(nullptr);
    });
    return true;
}

} // namespace

OvraVendor::CgiLibrary &OvraVendor::cgiLibrary() {
    static CgiLibrary library;
    return library;
}

extern "C" {

int OvraCgiInit(const char *name, OvraCgi *handle) {
    cgiLibrary().handles.obtained();
    const bool opened = !cgiLibrary().broken && std::strcmp(name, "") == 0;
    handle->store = opened ? new OvraCgiStore : nullptr;
    return opened ? 0 : -1;
}

void OvraCgiFree(OvraCgi *handle) {
    cgiLibrary().handles.givenBack();
    delete handle->store;
    handle->store = nullptr;
}

int OvraCgiSetOption(OvraCgi *handle, int option, const void *value) {
    if (!open(handle) || cgiLibrary().refusedOptions.count(option) != 0) {
        return 0;
    }
    switch (option) {
    case OVRA_CGI_OPT_SKIP_PASSWORD:
    case OVRA_CGI_OPT_MULTIPLE:
    case OVRA_CGI_OPT_TIMEOUT:
        handle->store->numbers[option] = *static_cast<const int *>(value);
        return 1;
    case OVRA_CGI_OPT_APP:
    case OVRA_CGI_OPT_EXTRA:
    case OVRA_CGI_OPT_UI:
        handle->store->texts[option] = static_cast<const char *>(value);
        return 1;
    default:
        return 0;
    }
}

const char *OvraCgiLoginUIJsonConfigTemplate() {
    return R"({"hide":false,"title":"session"})";
}

int OvraCgiLoginNoAuth(OvraCgi *handle, char *sid, size_t size, const char *client) {
    static int granted = 0;
    if (!open(handle) || handle->user[0] == '\0' ||
        handle->store->numbers[OVRA_CGI_OPT_SKIP_PASSWORD] == 0) {
        return 0;
    }
    Session session;
    session.id = "local-session-" + std::to_string(++granted);
    if (session.id.size() >= size) {
        return 0;
    }
    session.user = handle->user;
    session.app = handle->store->texts[OVRA_CGI_OPT_APP];
    session.extra = handle->store->texts[OVRA_CGI_OPT_EXTRA];
    session.ui = handle->store->texts[OVRA_CGI_OPT_UI];
    const auto timeout = handle->store->numbers.find(OVRA_CGI_OPT_TIMEOUT);
    session.timeout = timeout != handle->store->numbers.end() ? timeout->second : kHour;
    session.ends = session.timeout < 0 ? 0 : std::time(nullptr) + session.timeout;
    const char *const address = client != nullptr ? client : std::getenv("REMOTE_ADDR");
    session.client = address != nullptr ? address : "";
    if (handle->store->numbers[OVRA_CGI_OPT_MULTIPLE] == 0) {
        std::erase_if(cgiLibrary().sessions, [&session](const Session &other) {
            return other.user == session.user && other.app == session.app;
        });
    }
    std::snprintf(sid, size, "%s", session.id.c_str());
    cgiLibrary().sessions.push_back(session);
    return 1;
}

int OvraCgiRemoveSessionByFunc(OvraCgi *handle, OvraCgiTest test, void *argument) {
    if (!open(handle)) {
        return -1;
    }
    std::set<std::string> removed;
    for (const Session &session : std::vector<Session>(cgiLibrary().sessions)) {
        json_object *record = recordOf(session);
        if (test(record, argument) == 0) {
            removed.insert(session.id);
        }
        json_object_put(record);
    }
    std::erase_if(cgiLibrary().sessions,
                  [&removed](const Session &session) { return removed.count(session.id) == 1; });
    return 0;
}

int OvraCgiRemoveSessionByIndex(OvraCgi *handle, int field, const char *value) {
    if (!open(handle) || field != OVRA_CGI_FIELD_SID) {
        return -1;
    }
    std::erase_if(cgiLibrary().sessions,
                  [value](const Session &session) { return session.id == value; });
    return 0;
}

int OvraCgiGetSessionBySID(OvraCgi *handle, const char *sid, json_object **record) {
    if (!open(handle)) {
        return 0;
    }
    const auto &sessions = cgiLibrary().sessions;
    const auto found = std::find_if(sessions.begin(), sessions.end(),
                                    [sid](const Session &session) { return session.id == sid; });
    if (found == sessions.end()) {
        return 0;
    }
    *record = recordOf(*found);
    return 1;
}

int OvraCgiJsonRecordGet(json_object *record, int field, char *buffer, size_t size) {
    json_object *value = nullptr;
    if (json_object_object_get_ex(record, std::to_string(field).c_str(), &value) == 0) {
        return 0;
    }
    const std::string text = json_object_get_string(value);
    if (text.size() >= size) {
        return 0;
    }
    std::snprintf(buffer, size, "%s", text.c_str());
    return 1;
}

int OvraCgiGetRemoteIP(char *buffer, size_t size) {
    const char *const address = std::getenv("REMOTE_ADDR");
    return address != nullptr ? std::snprintf(buffer, size, "%s", address) : -1;
}
}
