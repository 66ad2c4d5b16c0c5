// SPDX-License-Identifier: Apache-2.0
#include "farlink_agent.h"
#include "support/daemon_program.h"
#include "support/sockets.h"
#include "support/soon.h"

#include <ovracredential/cred_request.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/farlink.h>
#include <ovraplatform/peer_trust.h>

#include <filesystem>
#include <fstream>

namespace {

using OvraPlatform::FarlinkSettings;
using OvraTest::soon;

constexpr int kPort = 20120;

void makeFolders() {
    for (const std::filesystem::path file :
         {OvraPlatform::kFarlinkFile, OvraPlatform::kFarlinkKeyFile}) {
        std::filesystem::create_directories(file.parent_path());
    }
}

/// An appliance, its relay service and a caller.
class TheFarlinkAgent : public testing::Test {
protected:
    TheFarlinkAgent() {
        makeFolders();
        constexpr std::string_view kReady = "farlinkd: ready, https ";
        const std::string line = relay.line();
        EXPECT_EQ(line.rfind(kReady, 0), 0U) << line;
        const int port = std::stoi(line.substr(kReady.size()));
        settings = {"127.0.0.1", port, "nas"};
        const auto met = OvraPlatform::peerFingerprint("https", "127.0.0.1", port, 10);
        EXPECT_TRUE(met);
        OvraPlatform::trustEndpoint("https", "127.0.0.1", port, met->fingerprint);
        agent.start();
    }
    ~TheFarlinkAgent() override {
        relay.end(SIGKILL); // or a poll would go on
        EXPECT_TRUE(agent.stop(std::chrono::steady_clock::now() + std::chrono::seconds(20)));
    }

    static std::string call() { return OvraTest::hearAll(OvraTest::dial(kPort)); }
    /// Where an appliance finds the alias: "HOST PORT", or "".
    static std::string lookUp(const std::string &alias) {
        const auto place =
            OvraPlatform::FarlinkClient(*OvraPlatform::readFarlinkSettings()).lookUp(alias);
        return place ? place->host + " " + std::to_string(place->port) : "";
    }

    OvraTest::DaemonProgram relay{{FARLINKD_PROGRAM, "--address", "127.0.0.1", "--port", "0",
                                   "--tunnel-port", "0", "--first-port", std::to_string(kPort),
                                   "--last-port", std::to_string(kPort)}};
    FarlinkSettings settings;
    Ovradrd::FarlinkAgent agent{[](const OvraService::ConnectedClient &client) {
        send(client.fd.get(), "welcome", 7, MSG_NOSIGNAL);
    }};
};

} // namespace

TEST_F(TheFarlinkAgent, IsReachedUnderItsAliasUntilTheRelayIsSwitchedOff) {
    Json::Value info;
    EXPECT_EQ(OVRA::CredRequestFarlink::GetConnInfo("nas", info, nullptr), 0) << "no relay";
    ASSERT_TRUE(OvraPlatform::writeFarlinkSettings(settings));
    ASSERT_TRUE(soon([this] { return agent.status().connected; })) << agent.status().problem;
    EXPECT_EQ(agent.status().port, kPort);
    EXPECT_TRUE(soon([] { return lookUp("NAS") == "127.0.0.1 " + std::to_string(kPort); }))
        << "the host of the service, which names none";
    EXPECT_NE(OVRA::CredRequestFarlink::GetConnInfo("NAS", info, nullptr), 0);
    EXPECT_EQ(info["host"], "nas.farlink.alt") << "whatever the relay says";
    EXPECT_EQ(call(), "welcome");
    EXPECT_EQ(lookUp("nobody"), "");

    ASSERT_TRUE(OvraPlatform::writeFarlinkSettings({}));
    EXPECT_EQ(call(), "") << "nobody answers";
    EXPECT_TRUE(soon([this] { return !agent.status().connected; }));
    EXPECT_EQ(agent.status().problem, "");
    EXPECT_EQ(lookUp("nas"), "");

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
