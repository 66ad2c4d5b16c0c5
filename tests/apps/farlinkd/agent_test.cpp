// SPDX-License-Identifier: Apache-2.0
#include "farlink_agent.h"
#include "relay_api.h"
#include "service/certificate.h"
#include "sockets.h"

#include <ovracredential/cred_request.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/farlink.h>

#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <optional>
#include <thread>

namespace {

using Farlinkd::RelayApi;
using Farlinkd::TunnelServer;
using OvraPlatform::FarlinkSettings;
using OvraService::HttpServer;
using OvraService::Listener;

constexpr std::chrono::seconds kSoon{20};
constexpr int kPort = 20120;

/// Whether it comes true within kSoon.
template <typename Condition>
bool soon(const Condition &condition) {
    for (const auto end = std::chrono::steady_clock::now() + kSoon;
         std::chrono::steady_clock::now() < end;) {
        if (condition()) {
            return true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    return false;
}

void makeFolders() {
    for (const std::filesystem::path file :
         {OvraPlatform::kFarlinkFile, OvraPlatform::kFarlinkKeyFile}) {
        std::filesystem::create_directories(file.parent_path());
    }
}

/// An appliance, its relay service and a caller, in one process.
class TheFarlinkAgent : public testing::Test {
protected:
    TheFarlinkAgent() {
        makeFolders();
        Listener tunnel = Listener::listen("127.0.0.1", 0).value();
        const int tunnelPort = tunnel.port;
        EXPECT_TRUE(tunnelServer.start(std::move(tunnel)));
        api.emplace(aliases, RelayApi::Settings{"127.0.0.1", "", tunnelPort},
                    RelayApi::Limits{.hold = std::chrono::seconds(0)});
        api->connect(tunnelServer);
        const std::string key = "/usr/ovra/relay.key", certificate = "/usr/ovra/relay.crt";
        EXPECT_TRUE(OvraService::createTlsKey(key));
        EXPECT_TRUE(OvraService::createCertificate(certificate, key, {"localhost", {}}));
        identity = OvraService::TlsIdentity::load(key, certificate).value();
        std::vector<Listener> listeners;
        listeners.push_back(Listener::listen("127.0.0.1", 0).value());
        settings = {"127.0.0.1", listeners[0].port, "nas"};
        EXPECT_TRUE(http.start(std::move(listeners), {}, identity));
        ticker = std::thread([this] {
            while (!over) {
                api->endOverdue();
                std::this_thread::sleep_for(std::chrono::milliseconds(50));
            }
        });
        agent.start();
    }
    ~TheFarlinkAgent() override {
        EXPECT_TRUE(OvraPlatform::writeFarlinkSettings({}));
        EXPECT_TRUE(agent.stop(std::chrono::steady_clock::now() + kSoon));
        over = true;
        ticker.join();
        http.quiesce();
        api->stop();
        http.stop();
    }

    static std::string call() { return FarlinkdTest::hearAll(FarlinkdTest::dial(kPort)); }
    /// Where an appliance finds the alias: the text of its information.
    static Json::Value lookUp(const std::string &alias) {
        Json::Value info;
        const int found = OVRA::CredRequestFarlink::GetConnInfo(alias, info, nullptr);
        EXPECT_EQ(found != 0, !info.isNull());
        return info;
    }

    Farlinkd::AliasRegistry aliases{"/usr/ovra/aliases", {kPort, kPort, std::chrono::hours(1)}};
    std::optional<RelayApi> api;
    TunnelServer tunnelServer{[this](const std::string &alias, const std::string &caller) {
                                  return api->announce(alias, caller);
                              },
                              {.answer = std::chrono::milliseconds(1000)}};
    OvraService::TlsIdentity identity;
    HttpServer http{[this](OvraService::HttpRequest request, const HttpServer::Answer &answer) {
                        api->serve(std::move(request), answer);
                    },
                    {}};
    FarlinkSettings settings;
    Ovradrd::FarlinkAgent agent{[](const OvraService::ConnectedClient &client) {
        send(client.fd.get(), "welcome", 7, MSG_NOSIGNAL);
    }};
    std::atomic<bool> over = false;
    std::thread ticker;
};

} // namespace

TEST_F(TheFarlinkAgent, IsReachedUnderItsAliasUntilTheRelayIsSwitchedOff) {
    EXPECT_TRUE(lookUp("nas").isNull()) << "no relay is set up";
    ASSERT_TRUE(OvraPlatform::writeFarlinkSettings(settings));
    ASSERT_TRUE(soon([this] { return agent.status().connected; })) << agent.status().problem;
    EXPECT_EQ(agent.status().port, kPort);
    Json::Value found;
    EXPECT_TRUE(soon([&] { return !(found = lookUp("NAS")).isNull(); }));
    EXPECT_EQ(found["port"], kPort);
    EXPECT_EQ(found["host"], "127.0.0.1") << "that of the service, which names none";
    EXPECT_EQ(found["protocol"], "https");
    EXPECT_EQ(call(), "welcome");
    EXPECT_TRUE(lookUp("nobody").isNull());

    ASSERT_TRUE(OvraPlatform::writeFarlinkSettings({}));
    EXPECT_EQ(call(), "") << "nobody answers";
    EXPECT_TRUE(soon([this] { return !agent.status().connected; }));
    EXPECT_EQ(agent.status().problem, "");
    EXPECT_TRUE(lookUp("nas").isNull());

    ASSERT_TRUE(OvraPlatform::writeFarlinkSettings(settings));
    EXPECT_TRUE(soon([] { return call() == "welcome"; })) << agent.status().problem;
}

TEST_F(TheFarlinkAgent, SaysWhyItIsNotConnected) {
    const auto other = OvraPlatform::FarlinkKey::loadOrCreate("/usr/ovra/other.key");
    settings.alias = "taken";
    ASSERT_TRUE(OvraPlatform::FarlinkClient(settings).enrol(other.value()));
    ASSERT_TRUE(OvraPlatform::writeFarlinkSettings(settings));
    EXPECT_TRUE(soon([this] {
        return agent.status().problem.find("belongs to another appliance") != std::string::npos;
    }));
    EXPECT_FALSE(agent.status().connected);
}

TEST(TheFarlinkSettings, AreReadAsWrittenOrRefused) {
    makeFolders();
    EXPECT_EQ(OvraPlatform::readFarlinkSettings().value(), FarlinkSettings()) << "no file";
    for (const FarlinkSettings &settings :
         {FarlinkSettings{"relay.example", 6000, "nas-1"}, FarlinkSettings{"2001:db8::1", 1, ""}}) {
        ASSERT_TRUE(OvraPlatform::writeFarlinkSettings(settings));
        EXPECT_EQ(OvraPlatform::readFarlinkSettings().value(), settings);
    }
    for (const char *text : {"host=\"a b\"", "host=\"relay\"\nport=\"0\"",
                             "host=\"relay\"\nport=\"5443x\"", "host=\"relay\"\nalias=\"NAS\""}) {
        std::ofstream(OvraPlatform::kFarlinkFile) << text << '\n';
        EXPECT_FALSE(OvraPlatform::readFarlinkSettings()) << text;
    }
}
