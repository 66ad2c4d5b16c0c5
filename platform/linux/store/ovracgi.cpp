// SPDX-License-Identifier: Apache-2.0
#include "ovracgi/ovracgi.h"

#include "ovraplatform/session_store.h"
#include "ovraplatform/session_walk.h"
#include "store/client_context.h"

#include <ovradrcore/log.h>

#include <json-c/json.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <memory>
#include <string>
#include <utility>

using OvraPlatform::SessionRecord;
using OvraPlatform::SessionRequest;
using OvraPlatform::SessionStore;

/// The data of a handle: the opened store and the login being built.
struct OvraCgiStore {
    SessionStore sessions;
    SessionRequest login;
    bool authenticated = false;
};

namespace {

thread_local const OvraPlatform::SessionFilter *walked = nullptr; ///< of the SessionWalk

struct PutJson {
    void operator()(json_object *object) const { json_object_put(object); }
};
using JsonObject = std::unique_ptr<json_object, PutJson>;

struct Field {
    int number;
    const char *member;
};

constexpr Field kFields[] = {
    {OVRA_CGI_FIELD_USER, "user"},
    {OVRA_CGI_FIELD_SID, "id"},
    {OVRA_CGI_FIELD_APP, "app"},
    {OVRA_CGI_FIELD_EXTRA, "extra"},
};

bool addText(json_object *object, const char *member, const std::string &text) {
    if (text.empty()) {
        return true;
    }
    json_object *const value =
        json_object_new_string_len(text.data(), static_cast<int>(text.size()));
    return value != nullptr && json_object_object_add(object, member, value) == 0;
}

JsonObject makeRecord(const SessionRecord &session) {
    JsonObject record(json_object_new_object());
    const bool complete = record && addText(record.get(), "user", session.user) &&
                          addText(record.get(), "id", session.id) &&
                          addText(record.get(), "app", session.app) &&
                          addText(record.get(), "extra", session.extra);
    return complete ? std::move(record) : nullptr;
}

OvraCgiStore *storeOf(OvraCgi *handle) {
    return handle != nullptr && handle->store != nullptr && handle->store->sessions.isOpen()
               ? handle->store
               : nullptr;
}

} // namespace

OvraPlatform::SessionWalk::SessionWalk(SessionFilter filter)
    : filter_(std::move(filter)) {
    walked = &filter_;
}

OvraPlatform::SessionWalk::~SessionWalk() {
    walked = nullptr;
}

int OvraCgiInit(const char * /*name*/, OvraCgi *handle) {
    if (handle == nullptr) {
        return -1;
    }
    *handle = OvraCgi{};
    handle->store = std::make_unique<OvraCgiStore>().release();
    return storeOf(handle) != nullptr ? 0 : -1;
}

void OvraCgiFree(OvraCgi *handle) {
    if (handle == nullptr) {
        return;
    }
    const std::unique_ptr<OvraCgiStore> store(handle->store);
    handle->store = nullptr;
}

int OvraCgiSetOption(OvraCgi *handle, int option, const void *value) {
    OvraCgiStore *const store = storeOf(handle);
    if (store == nullptr || value == nullptr) {
        return 0;
    }
    const auto number = [value] { return *static_cast<const int *>(value); };
    const auto text = [value] { return std::string(static_cast<const char *>(value)); };
    switch (option) {
    case OVRA_CGI_OPT_SKIP_PASSWORD:
        store->authenticated = number() != 0;
        return 1;
    case OVRA_CGI_OPT_MULTIPLE:
        store->login.keepOthers = number() != 0;
        return 1;
    case OVRA_CGI_OPT_TIMEOUT:
        if (number() == 0) {
            return 0;
        }
        store->login.timeout = number();
        return 1;
    case OVRA_CGI_OPT_APP:
        if (text().size() > SessionStore::kMaxApp) {
            return 0;
        }
        store->login.app = text();
        return 1;
    case OVRA_CGI_OPT_EXTRA:
    case OVRA_CGI_OPT_UI:
        if (!SessionStore::isData(text())) {
            return 0;
        }
        (option == OVRA_CGI_OPT_EXTRA ? store->login.extra : store->login.ui) = text();
        return 1;
    default:
        return 0;
    }
}

const char *OvraCgiLoginUIJsonConfigTemplate(void) {
    return R"({"hide":false})";
}

int OvraCgiLoginNoAuth(OvraCgi *handle, char *sid, size_t size, const char *client) {
    OvraCgiStore *const store = storeOf(handle);
    if (store == nullptr || sid == nullptr || size == 0) {
        return 0;
    }
    sid[0] = '\0';
    const std::size_t length = strnlen(handle->user, sizeof handle->user);
    if (!store->authenticated) {
        OVRA_ERR("A session without a password was asked for, but option %d does not say that the "
                 "user is authenticated. Set it.",
                 static_cast<int>(OVRA_CGI_OPT_SKIP_PASSWORD));
        return 0;
    }
    if (size <= SessionStore::kIdLength || length == sizeof handle->user) {
        OVRA_ERR("A login needs a closed user name and %zu bytes for the session id.",
                 SessionStore::kIdLength + 1);
        return 0;
    }
    SessionRequest login = store->login;
    login.user.assign(handle->user, length);
    login.remote = client != nullptr ? client : OvraPlatform::clientAddress().value_or("");
    const std::optional<std::string> id = store->sessions.create(login);
    if (!id) {
        return 0;
    }
    std::memcpy(sid, id->c_str(), id->size() + 1);
    return 1;
}

int OvraCgiRemoveSessionByFunc(OvraCgi *handle, OvraCgiTest test, void *argument) {
    OvraCgiStore *const store = storeOf(handle);
    if (store == nullptr || test == nullptr) {
        return -1;
    }
    const auto remove = [test, argument](const SessionRecord &session) {
        const JsonObject record = makeRecord(session);
        return record != nullptr && test(record.get(), argument) == 0;
    };
    return store->sessions.removeIf(remove, walked) ? 0 : -1;
}

int OvraCgiRemoveSessionByIndex(OvraCgi *handle, int field, const char *value) {
    OvraCgiStore *const store = storeOf(handle);
    if (store == nullptr || value == nullptr || field != OVRA_CGI_FIELD_SID) {
        return -1;
    }
    return store->sessions.remove(value) ? 0 : -1;
}

int OvraCgiGetSessionBySID(OvraCgi *handle, const char *sid, struct json_object **record) {
    OvraCgiStore *const store = storeOf(handle);
    if (store == nullptr || sid == nullptr || record == nullptr) {
        return 0;
    }
    *record = nullptr;
    const std::optional<SessionRecord> session = store->sessions.find(sid);
    if (!session) {
        return 0;
    }
    *record = makeRecord(*session).release();
    return *record != nullptr ? 1 : 0;
}

int OvraCgiJsonRecordGet(struct json_object *record, int field, char *buffer, size_t size) {
    const auto *const known =
        std::find_if(std::begin(kFields), std::end(kFields),
                     [field](const Field &entry) { return entry.number == field; });
    json_object *value = nullptr;
    if (known == std::end(kFields) || buffer == nullptr ||
        !json_object_object_get_ex(record, known->member, &value) ||
        !json_object_is_type(value, json_type_string)) {
        return 0;
    }
    const char *const text = json_object_get_string(value);
    const auto length = static_cast<std::size_t>(json_object_get_string_len(value));
    if (length >= size || std::memchr(text, '\0', length) != nullptr) {
        return 0;
    }
    std::memcpy(buffer, text, length + 1);
    return 1;
}

int OvraCgiGetRemoteIP(char *buffer, size_t size) {
    const std::optional<std::string> address = OvraPlatform::clientAddress();
    if (!address || buffer == nullptr || address->size() >= size) {
        return -1;
    }
    std::memcpy(buffer, address->c_str(), address->size() + 1);
    return static_cast<int>(address->size());
}
