// SPDX-License-Identifier: Apache-2.0
// Every file that is read, damaged at random: it is refused with a reason or healed, and nothing
// that it did not say is believed. OVRA_TORTURE=100 damages 10,000.
#include "alias_registry.h"
#include "apps/files/scene.h"
#include "credential/device_token.h"
#include "faults/damage.h"
#include "http/endpoint.h"
#include "login_throttle.h"
#include "service/tls_identity.h"
#include "shared/pending_releases.h"
#include "support/local_node.h"
#include "support/log_capture.h"
#include "support/torture.h"

#include <ovrabase/address.h>
#include <ovradrcore/cache.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/farlink.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/trust_store.h>

#include <gtest/gtest.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509.h>
#include <sys/mman.h>

#include <cstring>
#include <random>

using namespace OvraDRNode;
using namespace OvraPlatform;

namespace {

namespace fs = std::filesystem;
using OvraTest::readFile;
using OvraTest::writeFile;

const std::string kState = "/usr/ovra/var/ovradr/";
const std::string kEtc = "/usr/ovra/etc/ovradr/";
const std::string kAliases = "/usr/ovra/var/farlinkd/aliases";
const std::string kOtherKey = "SHA256:" + std::string(43, 'A');

class NumberCache : public OvraDRCore::Cache {
public:
    explicit NumberCache(int number)
        : Cache("/tmp/.ovradrcache//numbers", std::to_string(number), 1000, false, 3) {}
    Json::Value GetInfo() const override { return {}; }
    bool GetUpdatedData(Json::Value &) const override { return false; }
    bool IsValid(const Json::Value &) const override { return true; }
};

/// A kind of file and its use, in a process of its own. \return what is wrong; "" if nothing is
struct Kind {
    const char *name;
    std::string path;
    /// \param log  what was logged so far  \param said  what the use itself reported
    std::string (*use)(const LogCapture &log, const std::string &text);
    bool changes; ///< its use may change it

    friend void PrintTo(const Kind &kind, std::ostream *out) { *out << kind.name; }
};

const char *const kSilent = "refused without a reason";

std::string useCache(const LogCapture &, const std::string &) {
    for (int i = 0; i < 20; ++i) {
        const Json::Value value = NumberCache(i).GetCachedData();
        if (!value.isNull() && value != i) {
            return "a value that nobody stored";
        }
    }
    return NumberCache(0).UpdateWithData(99) && NumberCache(0).GetCachedData() == 99
               ? ""
               : "it is not healed";
}

std::string useTrust(const LogCapture &log, const std::string &text) {
    TrustStore store;
    for (const std::string endpoint :
         {"https://192.0.2.1:5001", "https://192.0.2.2:5001", "flk:nas2"}) {
        const TrustVerdict verdict = store.lookup(endpoint, kOtherKey);
        const bool named = ("\n" + text).find("\n" + endpoint + " ") != std::string::npos;
        if (verdict == TrustVerdict::kTrusted || (named && verdict == TrustVerdict::kUnknown)) {
            return "another key would be accepted for " + endpoint;
        }
    }
    const TrustVerdict pinned = store.pin("https://new:1", kOtherKey);
    const std::string now = readFile(kKnownEndpointsFile);
    if (pinned != TrustVerdict::kTrusted) {
        return now == text && log.count("known_endpoints") > 0 ? "" : kSilent;
    }
    return now.find(text) != std::string::npos ? "" : "lines are lost";
}

std::string useAccounts(const LogCapture &, const std::string &) {
    AccountStore store;
    if (store.verify("ann", "wrong password", "") == LoginResult::kOk) {
        return "a wrong password is right";
    }
    std::vector<Account> all;
    return store.list(all) || !store.error().empty() ? "" : kSilent;
}

std::string useSessions(const LogCapture &, const std::string &) {
    SessionStore store;
    if (store.find(std::string(SessionStore::kIdLength, 'A'))) {
        return "a session that was never granted";
    }
    std::vector<SessionRecord> all;
    if (!store.list(all) && store.error().empty()) {
        return kSilent;
    }
    SessionRequest request;
    request.user = "joe";
    const auto id = store.create(request);
    if (!id) {
        return store.error().empty() ? kSilent : "";
    }
    const auto found = store.find(*id);
    return (found && found->user == "joe") || !store.error().empty() ? "" : "a new one is lost";
}

std::string useReleases(const LogCapture &, const std::string &) {
    OvraApps::PendingReleases store;
    std::vector<OvraApps::PendingRelease> all;
    const bool listed = store.list(all) || !store.error().empty();
    return listed && (store.note({"new", {}, "n2", "c2"}) || !store.error().empty()) ? "" : kSilent;
}

std::string useLogins(const LogCapture &log, const std::string &) {
    Ovradrd::LoginThrottle throttle;
    int guesses = 0;
    for (int i = 0; i < 120; ++i) {
        guesses += throttle.admit({"ann", "192.0.2." + std::to_string(i), ""}) ? 1 : 0;
    }
    if (throttle.knows({"ann", "198.51.100.1", "never seen"})) {
        return "a stranger is known";
    }
    return guesses <= 100 ? ""
                          : std::to_string(guesses) + " guesses at once" +
                                (log.count("logins.db") > 0 ? "" : ", in silence");
}

std::string useNodes(const LogCapture &log, const std::string &) {
    std::vector<DRNode> nodes;
    DRNodeDB::List(nodes, DRNodeDB::CRED_TYPE_NODE | DRNodeDB::CRED_TYPE_TEMP);
    std::string attr;
    (void)!DRNodeDB::GetAttr("n1", "app", "name", attr);
    const bool set = DRNodeDB::SetAttr("n2", "app", "attr", "new");
    return set || log.count("ERR") > 0 ? "" : kSilent;
}

std::string useIdentity(const LogCapture &log, const std::string &text) {
    const std::string id = DRNode::getLocalNodeId();
    if (id.empty()) {
        return log.count("odeId") > 0 ? "" : kSilent;
    }
    const std::string now = readFile(OvraTest::kIdentityFile);
    if (now == text) {
        return text.find(id) != std::string::npos ? "" : "an id that is not there";
    }
    return log.count("odeId") > 0 && id == DRNode::getLocalNodeId() ? "" : "replaced in silence";
}

std::string useSettings(const LogCapture &log, const std::string &) {
    const ApplianceConfig config = readApplianceConfig();
    const bool ports = config.httpPort > 0 && config.httpPort < 65536 && config.httpsPort > 0 &&
                       config.httpsPort < 65536;
    const bool told = config.problems.empty() || log.count(kConfigFile) > 0;
    return ports && told &&
                   (config.servesAllAddresses || !config.problems.empty() ||
                    !config.addresses.empty())
               ? ""
               : kSilent;
}

std::string useRelay(const LogCapture &, const std::string &) {
    const auto settings = readFarlinkSettings();
    const bool usable = settings && settings->port > 0 && settings->port < 65536 &&
                        (settings->alias.empty() || isFarlinkAlias(settings->alias));
    return usable || (!settings && !settings.error().empty()) ? "" : kSilent;
}

std::string useSeal(const LogCapture &, const std::string &) {
    static const std::string whole = [] {
        const auto pair = SealKeyPair::load("/tmp/whole.seal");
        return pair ? fingerprintOf(pair->publicKey()) : "none";
    }();
    const auto pair = SealKeyPair::loadOrCreate(kSealKeyFile);
    return pair && fingerprintOf(pair->publicKey()) != whole ? "another key" : "";
}

/// Whether what the key signs is what the certificate's key signed.
std::string useTls(const LogCapture &, const std::string &) {
    const auto identity = OvraService::TlsIdentity::load(kTlsKeyFile, kTlsCertificateFile);
    if (!identity) {
        return identity.error().text.empty() ? kSilent : "";
    }
    const auto open = [](const std::string &text) {
        return BIO_new_mem_buf(text.data(), static_cast<int>(text.size()));
    };
    EVP_PKEY *const key =
        PEM_read_bio_PrivateKey(open(identity->key.get()), nullptr, nullptr, nullptr);
    X509 *const certificate =
        PEM_read_bio_X509(open(identity->certificate), nullptr, nullptr, nullptr);
    unsigned char signature[512];
    std::size_t size = sizeof(signature);
    EVP_MD_CTX *const sign = EVP_MD_CTX_new();
    EVP_MD_CTX *const verify = EVP_MD_CTX_new();
    const auto *const text = reinterpret_cast<const unsigned char *>("text");
    return key != nullptr && certificate != nullptr &&
                   EVP_DigestSignInit(sign, nullptr, EVP_sha256(), nullptr, key) == 1 &&
                   EVP_DigestSign(sign, signature, &size, text, 4) == 1 &&
                   EVP_DigestVerifyInit(verify, nullptr, EVP_sha256(), nullptr,
                                        X509_get0_pubkey(certificate)) == 1 &&
                   EVP_DigestVerify(verify, signature, size, text, 4) == 1
               ? ""
               : "a key that opens no connection";
}

std::string useAliases(const LogCapture &, const std::string &text) {
    Farlinkd::AliasRegistry registry(kAliases, {20000, 20010, std::chrono::hours(1)});
    if (const auto loaded = registry.load(); !loaded) {
        return loaded.error().text.empty() ? kSilent : "";
    }
    for (const Farlinkd::Alias &alias : registry.list()) {
        if (text.find(alias.name + " ") == std::string::npos ||
            (alias.expires > 1000 && registry.enrol(alias.name, std::string(43, 'z'), 1000))) {
            return "an alias is taken from its owner";
        }
    }
    return "";
}

std::string useFarlinkKey(const LogCapture &, const std::string &) {
    static const std::string whole = FarlinkKey::loadOrCreate("/tmp/whole.farlink")->publicText();
    const auto key = FarlinkKey::loadOrCreate();
    return !key || (key->publicText() == whole &&
                    verifyFarlink(whole, "a", "b", key->sign("a", "b")))
               ? ""
               : "another key";
}

std::string useDeviceKey(const LogCapture &log, const std::string &) {
    const auto token = [] {
        return std::string(deviceToken(*Endpoint::make("https", "192.0.2.1", 5001), "ann").get());
    };
    const std::string found = token();
    const bool told = log.count("device.key") > 0;
    OvraTest::writeFile(kDeviceKeyFile, readFile("/tmp/whole.device"));
    return found == token() || (found.empty() && told) ? "" : "another key";
}

const Kind kKinds[] = {
    {"cache", "/tmp/.ovradrcache/numbers", useCache, true},
    {"pins", kState + "known_endpoints", useTrust, true},
    {"accounts", kState + "accounts.db", useAccounts, false},
    {"sessions", kState + "sessions.db", useSessions, true},
    {"releases", kState + "releases.db", useReleases, true},
    {"logins", kState + "logins.db", useLogins, true},
    {"nodes", kEtc + "node.db", useNodes, true},
    {"identity", kEtc + "node.info", useIdentity, true},
    {"settings", kEtc + "ovradrd.conf", useSettings, false},
    {"relay", kEtc + "farlink.conf", useRelay, false},
    {"seal", kEtc + "ovradrd.seal", useSeal, false},
    {"tlsKey", kEtc + "ovradrd.key", useTls, false},
    {"certificate", kEtc + "ovradrd.crt", useTls, false},
    {"aliases", kAliases, useAliases, false},
    {"relayKey", kState + "farlink.key", useFarlinkKey, false},
    {"deviceKey", kState + "device.key", useDeviceKey, true},
};

/// The process's last word.
char *const word = static_cast<char *>(
    mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));

class DamagedFile : public testing::TestWithParam<Kind> {
protected:
    void SetUp() override {
        OvradrTest::unpack(OvradrTest::newestArchive());
        for (int i = 0; i < 20; ++i) {
            ASSERT_TRUE(NumberCache(i).UpdateWithData(i));
        }
        Ovradrd::LoginThrottle throttle;
        for (int i = 0; i < 50; ++i) {
            const Ovradrd::LoginThrottle::Login login{"a" + std::to_string(i % 5),
                                                      "192.0.2." + std::to_string(i), ""};
            if (const auto attempt = throttle.admit(login); attempt && i % 2 == 0) {
                throttle.recordSuccess(login, *attempt);
            }
        }
        ASSERT_FALSE(deviceToken(*Endpoint::make("https", "192.0.2.1", 5001), "ann").get().empty());
        ASSERT_TRUE(FarlinkKey::loadOrCreate());
        for (const auto &[name, copy] : {std::pair(kSealKeyFile, "/tmp/whole.seal"),
                                         {kFarlinkKeyFile, "/tmp/whole.farlink"},
                                         {kDeviceKeyFile, "/tmp/whole.device"}}) {
            fs::copy(name, copy, fs::copy_options::overwrite_existing);
        }
        mode_ = OvraTest::modeOf(GetParam().path);
        whole_ = readFile(GetParam().path);
        ASSERT_FALSE(whole_.empty());
    }
    void put(const std::string &text) const {
        writeFile(GetParam().path, text);
        chmod(GetParam().path.c_str(), mode_);
    }

    std::string whole_;
    unsigned int mode_ = 0;
};

} // namespace

TEST_P(DamagedFile, IsRefusedWithAReasonOrHealed) {
    const Kind &kind = GetParam();
    const int rounds = std::max(12, 625 * OvraTest::tortureScale() / 100);
    std::mt19937 random(20);
    for (int round = 0; round < rounds && !HasFailure(); ++round) {
        const std::string text =
            round == 0 ? whole_.substr(0, 1) : OvraTest::damage(whole_, random);
        put(text);
        std::memset(word, 0, 4096);
        OvraTest::OtherProcess process([&] {
            const LogCapture log;
            alarm(20);
            std::strncpy(word, kind.use(log, text).c_str(), 1000);
            return 0;
        });
        const int code = process.wait();
        EXPECT_EQ(code, 0) << "it crashed or hung";
        EXPECT_STREQ(word, "");
        EXPECT_TRUE(kind.changes || readFile(kind.path) == text) << "it was changed";
        if (round % 25 == 13) { // the programs too
            put(text);
            EXPECT_FALSE(OvradrTest::useDaemon().empty());
            EXPECT_GE(OvradrTest::run({"doctor"}).exit, 0);
        }
        if (HasFailure()) {
            ADD_FAILURE() << "round " << round << ": "
                          << testing::PrintToString(text.substr(0, 400));
        }
    }
}
INSTANTIATE_TEST_SUITE_P(Of, DamagedFile, testing::ValuesIn(kKinds),
                         [](const auto &kind) { return std::string(kind.param.name); });
