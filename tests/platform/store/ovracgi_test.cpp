// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"

#include <ovracgi/ovracgi.h>
#include <ovraplatform/client_scope.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/session_walk.h>

#include <json-c/json.h>

#include <array>
#include <cstdio>
#include <cstring>
#include <string>
#include <thread>
#include <utility>

using namespace OvraPlatform;

namespace {

/// An opened handle, as the node library uses it: one per operation.
struct Handle : OvraCgi {
    Handle() { opened = OvraCgiInit("", this); }
    ~Handle() { OvraCgiFree(this); }
    Handle(const Handle &) = delete;
    Handle &operator=(const Handle &) = delete;

    int option(int name, int value) { return OvraCgiSetOption(this, name, &value); }
    int option(int name, const char *value) { return OvraCgiSetOption(this, name, value); }

    int opened = -1;
};

std::string field(json_object *record, int number) {
    std::array<char, 1024> buffer{};
    return OvraCgiJsonRecordGet(record, number, buffer.data(), buffer.size()) != 0 ? buffer.data()
                                                                                   : "(none)";
}

struct Cgi : OvraTest::OwnFiles {
    static std::string login(const std::string &user, const char *app = "Tidewater",
                             const char *client = nullptr) {
        Handle handle;
        std::snprintf(handle.user, sizeof handle.user, "%s", user.c_str());
        std::array<char, 100> sid{};
        handle.option(OVRA_CGI_OPT_SKIP_PASSWORD, 1);
        handle.option(OVRA_CGI_OPT_MULTIPLE, 1);
        handle.option(OVRA_CGI_OPT_APP, app);
        handle.option(OVRA_CGI_OPT_EXTRA, R"({"node_id":"n1"})");
        EXPECT_EQ(OvraCgiLoginNoAuth(&handle, sid.data(), sid.size(), client), 1);
        return sid.data();
    }
    static bool isLive(const std::string &sid) { return SessionStore().find(sid).has_value(); }
    static std::string remoteOf(const std::string &sid) {
        return SessionStore().find(sid).value().remote;
    }
    static std::string remoteIp() {
        std::array<char, 64> buffer{};
        const int length = OvraCgiGetRemoteIP(buffer.data(), buffer.size());
        return length == static_cast<int>(std::strlen(buffer.data())) ? buffer.data() : "(none)";
    }
};

TEST_F(Cgi, ALoginGivesASessionWhoseFieldsAreReadByNumberOrNoneIfItIsNotComplete) {
    const std::string sid = login("ann");
    ASSERT_EQ(sid.size(), 43U);
    Handle handle;
    json_object *record = nullptr;
    ASSERT_EQ(OvraCgiGetSessionBySID(&handle, sid.c_str(), &record), 1);
    EXPECT_EQ(field(record, OVRA_CGI_FIELD_APP), "Tidewater");
    EXPECT_EQ(field(record, 3), "(none)");
    std::array<char, 4> small{};
    EXPECT_NE(OvraCgiJsonRecordGet(record, OVRA_CGI_FIELD_USER, small.data(), 4), 0);
    EXPECT_EQ(OvraCgiJsonRecordGet(record, OVRA_CGI_FIELD_USER, small.data(), 3), 0);
    EXPECT_EQ(OvraCgiJsonRecordGet(nullptr, OVRA_CGI_FIELD_USER, small.data(), 4), 0);
    json_object_put(record);
    std::array<char, 100> buffer{};
    std::strcpy(handle.user, "ann");
    EXPECT_EQ(OvraCgiLoginNoAuth(&handle, buffer.data(), buffer.size(), nullptr), 0)
        << "no option 1";
    handle.option(OVRA_CGI_OPT_SKIP_PASSWORD, 1);
    EXPECT_EQ(OvraCgiLoginNoAuth(&handle, buffer.data(), 43, nullptr), 0) << "buffer too small";
    EXPECT_EQ(OvraCgiLoginNoAuth(&handle, nullptr, 100, nullptr), 0);
    std::memset(handle.user, 'a', sizeof handle.user);
    EXPECT_EQ(OvraCgiLoginNoAuth(&handle, buffer.data(), buffer.size(), nullptr), 0)
        << "never closed";
    handle.user[0] = '\0';
    EXPECT_EQ(OvraCgiLoginNoAuth(&handle, buffer.data(), buffer.size(), nullptr), 0) << "nobody";
    EXPECT_STREQ(buffer.data(), "");
    EXPECT_EQ(handle.option(OVRA_CGI_OPT_TIMEOUT, 0) + handle.option(99, 1), 0);
    EXPECT_EQ(handle.option(OVRA_CGI_OPT_EXTRA, "no JSON"), 0);
    EXPECT_EQ(handle.option(OVRA_CGI_OPT_UI, "[]"), 0);
    EXPECT_EQ(handle.option(OVRA_CGI_OPT_APP, std::string(256, 'a').c_str()), 0);
    EXPECT_EQ(OvraCgiSetOption(&handle, OVRA_CGI_OPT_APP, nullptr), 0);
}

TEST_F(Cgi, AWalkVisitsAndRemovesWhatItIsAboutAndItsTestMayUseTheStore) {
    const std::string ann = login("ann");
    const std::string other = login("ann", "web");
    const std::string bob = login("bob");
    const auto walk = [](bool removes) {
        std::pair<std::string, bool> state("", removes);
        const auto test = [](json_object *record, void *argument) {
            auto &[seen, removing] = *static_cast<std::pair<std::string, bool> *>(argument);
            seen += isLive(field(record, OVRA_CGI_FIELD_SID)) ? field(record, OVRA_CGI_FIELD_USER)
                                                              : "gone";
            return removing && field(record, OVRA_CGI_FIELD_APP) == "Tidewater" ? 0 : 1;
        };
        Handle handle;
        EXPECT_EQ(OvraCgiRemoveSessionByFunc(&handle, test, &state), 0);
        return state.first;
    };
    EXPECT_EQ(walk(false).size(), 9U);
    {
        const SessionWalk about({"ann", "Tidewater", R"({"node_id":"n1"})"});
        EXPECT_EQ(walk(true), "ann");
    }
    EXPECT_FALSE(isLive(ann));
    EXPECT_EQ(walk(false).size(), 6U);
    Handle handle;
    EXPECT_NE(OvraCgiRemoveSessionByFunc(&handle, nullptr, nullptr), 0);
    EXPECT_NE(OvraCgiRemoveSessionByIndex(&handle, OVRA_CGI_FIELD_USER, "bob"), 0);
    EXPECT_TRUE(isLive(bob));
    EXPECT_EQ(OvraCgiRemoveSessionByIndex(&handle, OVRA_CGI_FIELD_SID, bob.c_str()), 0);
    EXPECT_FALSE(isLive(bob));
    EXPECT_TRUE(isLive(other));
}

TEST_F(Cgi, TheClientIsTheOneThatTheThreadServesElseTheEnvironments) {
    unsetenv("REMOTE_ADDR");
    EXPECT_EQ(remoteIp(), "(none)");
    EXPECT_EQ(remoteOf(login("ann")), "");
    setenv("REMOTE_ADDR", "127.0.0.1", 1);
    EXPECT_EQ(remoteOf(login("ann")), "127.0.0.1");
    {
        const ClientScope outer("192.0.2.1");
        {
            const ClientScope inner("2001:db8::1");
            EXPECT_EQ(remoteIp(), "2001:db8::1");
            EXPECT_EQ(remoteOf(login("ann")), "2001:db8::1");
            std::thread([] { EXPECT_EQ(remoteIp(), "127.0.0.1"); }).join();
        }
        EXPECT_EQ(remoteIp(), "192.0.2.1");
        EXPECT_EQ(remoteOf(login("ann", "web", "198.51.100.1")), "198.51.100.1");
        const ClientScope local("");
        EXPECT_EQ(remoteIp(), "(none)");
    }
    EXPECT_EQ(remoteIp(), "127.0.0.1");
    setenv("REMOTE_ADDR", "127.0.0.1\nforged", 1);
    EXPECT_EQ(remoteIp(), "(none)");
    std::array<char, 9> small{};
    setenv("REMOTE_ADDR", "127.0.0.1", 1);
    EXPECT_EQ(OvraCgiGetRemoteIP(small.data(), small.size()), -1);
}

TEST_F(Cgi, AHandleThatDidNotOpenIsSafeToUse) {
    OvraTest::writeFile(kSessionsFile, "this is no store");
    chmod(kStateDir, 0700);
    Handle handle;
    EXPECT_NE(handle.opened, 0);
    std::strcpy(handle.user, "ann");
    std::array<char, 100> sid{};
    json_object *record = nullptr;
    EXPECT_EQ(handle.option(OVRA_CGI_OPT_SKIP_PASSWORD, 1), 0);
    EXPECT_EQ(OvraCgiLoginNoAuth(&handle, sid.data(), sid.size(), nullptr), 0);
    EXPECT_NE(OvraCgiRemoveSessionByIndex(&handle, OVRA_CGI_FIELD_SID, "x"), 0);
    EXPECT_NE(OvraCgiRemoveSessionByFunc(
                  &handle, [](json_object *, void *) { return 1; }, nullptr),
              0);
    EXPECT_NE(OvraCgiGetSessionBySID(&handle, "x", &record), 1);
    OvraCgiFree(&handle);
    EXPECT_EQ(handle.option(OVRA_CGI_OPT_SKIP_PASSWORD, 1), 0);
    EXPECT_NE(OvraCgiInit("", nullptr), 0);
}

} // namespace
