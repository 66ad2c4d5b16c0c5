// SPDX-License-Identifier: Apache-2.0

// The appliance's store of login sessions, in memory.

#include "stand_in.h"

#include <ovracgi/ovracgi.h>

#include <json-c/json_object.h>

#include <cstdio>
#include <cstdlib>

using OvraVendor::cgiLibrary;
using OvraVendor::Session;

/// The session to make.
struct OvraCgiStore : Session {};

namespace {

void recordGone(json_object * /*record*/, void * /*data*/) {
    --cgiLibrary.records;
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
    ++cgiLibrary.records;
    json_object_set_userdata(record, nullptr, recordGone);
    return record;
}

} // namespace

extern "C" {

int OvraCgiInit(const char * /*name*/, OvraCgi *handle) {
    ++cgiLibrary.handles;
    handle->store = new OvraCgiStore;
    return 0;
}

void OvraCgiFree(OvraCgi *handle) {
    --cgiLibrary.handles;
    delete handle->store;
}

int OvraCgiSetOption(OvraCgi *handle, int option, const void *value) {
    Session &session = *handle->store;
    const std::map<int, std::string *> texts = {{OVRA_CGI_OPT_APP, &session.app},
                                                {OVRA_CGI_OPT_EXTRA, &session.extra},
                                                {OVRA_CGI_OPT_UI, &session.ui}};
    if (const auto text = texts.find(option); text != texts.end()) {
        *text->second = static_cast<const char *>(value);
    } else if (option == OVRA_CGI_OPT_TIMEOUT) {
        session.timeout = *static_cast<const int *>(value);
    }
    return cgiLibrary.refusedOptions.count(option) == 0 ? 1 : 0;
}

const char *OvraCgiLoginUIJsonConfigTemplate() {
    return R"({"hide":false,"title":"session"})";
}

int OvraCgiLoginNoAuth(OvraCgi *handle, char *sid, size_t size, const char * /*client*/) {
    static int granted = 0;
    Session &session = *handle->store;
    session.id = "local-session-" + std::to_string(++granted);
    session.user = handle->user;
    const char *const address = std::getenv("REMOTE_ADDR");
    session.client = address != nullptr ? address : "";
    std::snprintf(sid, size, "%s", session.id.c_str());
    cgiLibrary.sessions.push_back(session);
    return 1;
}

int OvraCgiRemoveSessionByFunc(OvraCgi * /*handle*/, OvraCgiTest test, void *argument) {
    std::erase_if(cgiLibrary.sessions, [&](const Session &session) {
        json_object *record = recordOf(session);
        const bool removed = test(record, argument) == 0;
        json_object_put(record);
        return removed;
    });
    return 0;
}

int OvraCgiRemoveSessionByIndex(OvraCgi * /*handle*/, int /*field*/, const char *value) {
    std::erase_if(cgiLibrary.sessions,
                  [value](const Session &session) { return session.id == value; });
    return 0;
}

int OvraCgiGetSessionBySID(OvraCgi * /*handle*/, const char *sid, json_object **record) {
    for (const Session &session : cgiLibrary.sessions) {
        if (session.id == sid) {
            *record = recordOf(session);
            return 1;
        }
    }
    return 0;
}

int OvraCgiJsonRecordGet(json_object *record, int field, char *buffer, size_t size) {
    json_object *value = nullptr;
    json_object_object_get_ex(record, std::to_string(field).c_str(), &value);
    if (value == nullptr) {
        return 0;
    }
    std::snprintf(buffer, size, "%s", json_object_get_string(value));
    return 1;
}

int OvraCgiGetRemoteIP(char *buffer, size_t size) {
    const char *const address = std::getenv("REMOTE_ADDR");
    return address != nullptr ? std::snprintf(buffer, size, "%s", address) : -1;
}
}
