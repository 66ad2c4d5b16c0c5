// SPDX-License-Identifier: Apache-2.0
#include "http/endpoint.h"

#include <ovradrcore/json.h>
#include <ovraplatform/wire_form.h>

#include <gtest/gtest.h>

namespace {

using namespace OvraPlatform;

TEST(WireForm, BringsEveryValueBackAsItWas) {
    WireCall call{{"OVRA.DR.Node", 2, "info"}};
    call.sid = "a+b/c=&d %";
    call.params["text"] = std::string(1, '\0') + " \"quoted\" & + % \xC3\xA9\n";
    call.params["number"] = -17;
    call.params["list"].append(1.5);
    call.params["list"].append(Json::Value());
    call.params["a name=&"]["inner"] = true;

    const auto body = encodeForm(call);
    ASSERT_TRUE(body);
    EXPECT_TRUE(body->starts_with("api=OVRA.DR.Node&version=2&method=info&_sid=")) << *body;
    auto read = decodeForm(*body);
    ASSERT_TRUE(read && read->params.empty());
    ASSERT_EQ(parseParams(*read), OvraDRCore::JsonFault::kNone);
    EXPECT_EQ(encodeForm(*read), body);
    EXPECT_EQ(read->sid, call.sid);
    EXPECT_EQ(OvraDRCore::toString(read->params), OvraDRCore::toString(call.params));
    auto others = decodeForm("method=get&&x=%22a+b%2f%2F%22&version=1&api=A&");
    ASSERT_TRUE(others && parseParams(*others) == OvraDRCore::JsonFault::kNone)
        << "as other clients write it";
    EXPECT_EQ(others->params["x"], "a b//");
}

TEST(WireForm, RefusesWhatIsNoCall) {
    for (const char *body :
         {"", "api=A&method=m", "api=A&version=0&method=m", "api=A&version=1x&method=m",
          "api=A&version=99999999999&method=m", "version=1&method=m", "api=A&version=1",
          "api=A&version=1&method=m&x", "api=A&version=1&method=m&x=%2",
          "api=A&version=1&method=%zz", "api=A&version=1&method=m&x=1&x=2",
          "api=A&version=1&method=m&api=B", "api=A&version=1&method=m&sealed=s&x=1",
          "api=A&version=1&method=m&sealed=s&_sid=t"}) {
        ASSERT_FALSE(decodeForm(body)) << body;
        EXPECT_NE(decodeForm(body).error(), "") << body;
    }
    const std::pair<const char *, OvraDRCore::JsonFault> faults[] = {
        {"x=text", OvraDRCore::JsonFault::kNotJson},
        {"x=1,%22y%22:2", OvraDRCore::JsonFault::kNotJson},
        {"x=[0,0]&y=[0,0]", OvraDRCore::JsonFault::kTooManyValues}};
    for (const auto &[params, fault] : faults) {
        auto call = decodeForm(std::string("api=A&version=1&method=m&") + params);
        ASSERT_TRUE(call) << params;
        EXPECT_EQ(parseParams(*call, {.values = 5}), fault) << params;
    }
    std::string many = "api=A&version=1&method=m";
    for (int i = 0; i < 1000; ++i) {
        many += "&p" + std::to_string(i) + "=1";
    }
    EXPECT_FALSE(decodeForm(many));
    for (const char *name : {"api", "version", "method", "_sid", "sealed"}) {
        WireCall call{{"A", 1, "m"}};
        call.params[name] = 1;
        EXPECT_FALSE(encodeForm(call)) << name;
    }
}

TEST(Endpoint, HasOneSpellingOrIsRefused) {
    const auto key = [](const char *protocol, const char *host, int port) {
        const auto endpoint = Endpoint::make(protocol, host, port);
        return endpoint ? endpoint->key() : "";
    };
    EXPECT_EQ(key("https", "NAS.Example", 5001), "https://nas.example:5001");
    EXPECT_EQ(key("http", "10.0.0.2", 80), "http://10.0.0.2:80");
    EXPECT_EQ(key("https", "2001:DB8:0::1", 1), "https://[2001:db8::1]:1");
    EXPECT_EQ(key("https", "[::1]", 65535), "https://[::1]:65535");
    EXPECT_EQ(key("https", "FE80::1%eth0", 1), "https://[fe80::1%eth0]:1");
    EXPECT_EQ(Endpoint::make("https", "fe80::1%eth0", 1)->url("x"), "https://[fe80::1]:1/x");
    for (const char *protocol : {"flk", "HTTPS", "ftp"}) {
        EXPECT_EQ(key(protocol, "a", 1), "") << protocol;
    }
    for (const char *host : {"", "a b", "a/b", "u@a", "a?b", "a#b", "a\nb", "a\\b", "a%41", "a:80",
                             "[::1", "fe80::1%a/b", "2001:db8::1%eth0"}) {
        EXPECT_EQ(key("https", host, 1), "") << host;
    }
    EXPECT_EQ(key("https", "a", 0) + key("https", "a", 65536), "");
    const auto endpoint = Endpoint::make("https", "a", 1);
    ASSERT_TRUE(endpoint);
    EXPECT_EQ(endpoint->url("webapi/query.cgi"), "https://a:1/webapi/query.cgi");
    for (const char *path : {"a?b", "a#b", "a b", "a\r\nb", "a@b", "%2e"}) {
        EXPECT_FALSE(endpoint->url(path)) << path;
    }
}

} // namespace
