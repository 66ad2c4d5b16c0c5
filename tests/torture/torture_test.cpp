// SPDX-License-Identifier: Apache-2.0
#include "alias_registry.h"
#include "faults/faults.h"
#include "provision/node_database.h"
#include "shared/pending_releases.h"
#include "support/local_node.h"
#include "support/other_process.h"
#include "support/torture.h"

#include <ovradrcore/cache.h>
#include <ovradrnode/node_db.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/trust_store.h>

#include <gtest/gtest.h>
#include <sys/mman.h>

#include <climits>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <ostream>
#include <random>
#include <regex>
#include <vector>

using namespace OvraDRNode;
using namespace OvraPlatform;
using OvraTest::Fault;
using OvraTest::FaultPlan;
using OvraTest::Lie;
using OvraTest::OtherProcess;
using OvraTest::tortureScale;

namespace {

namespace fs = std::filesystem;

/// What the processes of a case tell each other.
struct Shared {
    bool met;
    bool done;        ///< the change was acknowledged
    long number;      ///< the last one acknowledged
    char told[64];    ///< the identity that was acknowledged
    char text[16384]; ///< a result
};
Shared &shared = *static_cast<Shared *>(
    mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));

void tell(char *place, std::size_t size, const std::string &text) {
    std::strncpy(place, text.c_str(), size - 1);
}

/// One operation: any process may find what there was before it, or after it, and nothing else.
struct Scene {
    const char *name;
    void (*prepare)();
    bool (*change)();
    std::string (*state)();

    friend void PrintTo(const Scene &scene, std::ostream *out) { *out << scene.name; }
};

class TestCache : public OvraDRCore::Cache {
public:
    explicit TestCache(const std::string &name)
        : Cache("/tmp/.ovradrcache//torture", name, 1000, false, 3) {}
    Json::Value GetInfo() const override { return {}; }
    bool GetUpdatedData(Json::Value &) const override { return false; }
    bool IsValid(const Json::Value &) const override { return true; }
};

std::string fileText(const char *path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// "none", "id", or what is wrong with it.
std::string identity() {
    const std::string text = fileText(OvraTest::kIdentityFile);
    const std::string told = shared.told;
    const bool whole = text.size() == 47 && text.rfind("node_id=\"", 0) == 0;
    return text.empty()
               ? "none"
               : (whole && text.find(told) != text.npos ? "id" : "[" + text + "] not " + told);
}

bool makeIdentity() {
    const std::string id = DRNode::getLocalNodeId();
    tell(shared.told, sizeof(shared.told), id);
    return !id.empty();
}

/// Rows, and whether SQLite finds the file sound.
std::string rows(const char *path, const std::string &sql) {
    return OvraTest::querySql("PRAGMA integrity_check; " + sql, path);
}
std::string nodeRows() {
    return rows(OvraTest::kNodeDatabase,
                "SELECT port, cred_id FROM node_cred; SELECT cred_id FROM temp_cred;"
                "SELECT value FROM node_attr");
}
std::string sessionRows() {
    return rows(kSessionsFile,
                "SELECT count(*), user FROM session GROUP BY user; SELECT * FROM tally");
}

void prepareNode() {
    OvraTest::provisionNode();
    for (const char *id : {"c1", "c2", "c3"}) {
        OvraTest::addCred("node_cred", "n1", id, "https", 1, "s1");
    }
    OvraTest::addCred("temp_cred", "n1", "t1", "https", 1, "s1");
    (void)!DRNodeDB::SetAttr("n1", "app", "attr", "old");
    DRNode::getLocalNodeId();
}

bool grant(const char *user) {
    SessionRequest request;
    request.user = user;
    return SessionStore().create(request).has_value();
}

/// "none" without rows, and for a database without tables, which a process that was killed may
/// leave.
std::string madeRows(const char *path, const char *sql) {
    const bool made =
        fs::exists(path) && rows(path, "SELECT count(*) FROM sqlite_schema") != "ok\n0\n";
    const std::string all = made ? rows(path, sql) : "";
    return all.size() > 3 ? all : "none";
}

constexpr const char *kAliases = "/usr/ovra/var/ovradr/aliases";
bool enrol(const char *alias) {
    Farlinkd::AliasRegistry registry(kAliases, {20000, 20010, std::chrono::hours(1)});
    return registry.load() && registry.enrol(alias, "key", 1000);
}

bool note() {
    OvraApps::PendingRelease release;
    release.session = "s9";
    release.conn = Conn::https("127.0.0.1", 9);
    release.nodeId = "n9";
    release.credId = "c9";
    return OvraApps::PendingReleases().note(release);
}

void prepareFolder() {
    fs::create_directories("/usr/ovra/var/ovradr");
    fs::permissions("/usr/ovra/var/ovradr", fs::perms::owner_all);
}

void prepareStores() {
    prepareFolder();
    const bool made = grant("joe") && grant("ann") && note() && enrol("old") &&
                      TrustStore().create() &&
                      AccountStore().add("joe", "password", OvraPlatform::Role::kUser);
    if (!made) {
        std::abort();
    }
}

const Scene kScenes[] = {
    {"cacheNew", [] {}, [] { return TestCache("a").UpdateWithData("new"); },
     [] { return TestCache("a").GetCachedData().asString(); }},
    {"cacheUpdate",
     [] { (void)(TestCache("a").UpdateWithData("old") && TestCache("b").UpdateWithData("b")); },
     [] { return TestCache("a").UpdateWithData("new"); },
     [] {
         return TestCache("a").GetCachedData().asString() +
                TestCache("b").GetCachedData().asString();
     }},
    {"identityNew", [] {}, makeIdentity, identity},
    {"identityKept", [] { (void)makeIdentity(); }, [] { return !DRNode::getLocalNodeId().empty(); },
     identity},
    {"identityReset", [] { DRNode::getLocalNodeId(); },
     [] { return DRNode::resetLocalNodeId() && !fs::exists(OvraTest::kIdentityFile); }, identity},
    {"nodeInsert", prepareNode, [] { return DRNodeDB::SetAttr("n2", "app", "attr", "new"); },
     nodeRows},
    {"nodeUpdate", prepareNode, [] { return DRNodeDB::SetConn("c2", Conn::https("127.0.0.1", 2)); },
     nodeRows},
    {"nodeDelete", prepareNode, [] { return DRNodeDB::Delete("n1"); }, nodeRows},
    {"sessionGrant", prepareStores, [] { return grant("eve"); }, sessionRows},
    {"sessionRelease", prepareStores,
     [] {
         return SessionStore().removeIf(
             [](const SessionRecord &session) { return session.user == "joe"; });
     },
     sessionRows},
    {"accountChange", prepareStores, [] { return AccountStore().setDisabled("joe", true); },
     [] { return rows(kAccountsFile, "SELECT name, disabled FROM account"); }},
    {"trustPin", prepareStores,
     [] {
         return TrustStore().pin("https://n1:5001", "SHA256:" + std::string(43, 'A')) ==
                TrustVerdict::kTrusted;
     },
     [] { // without the time, which passes
         static const std::regex kSeconds("#since [0-9]+");
         return std::regex_replace(fileText(kKnownEndpointsFile), kSeconds, "#since");
     }},
    {"releaseNote", prepareStores,
     [] {
         std::vector<OvraApps::PendingRelease> all;
         return OvraApps::PendingReleases().list(all) &&
                (all.empty() || OvraApps::PendingReleases().remove(all[0]));
     },
     [] { return rows(OvraApps::kPendingReleasesFile, "SELECT count(*) FROM release"); }},
    {"aliasEnrolment", prepareStores, [] { return enrol("new"); },
     [] { return fileText(kAliases); }},
    // What was not there before.
    {"nodeFirst", [] { fs::create_directories("/usr/ovra/etc/ovradr"); },
     [] {
         return Ovradr::provisionNodeDatabase(OvraTest::kNodeDatabase, OVRA_NODE_SQL).has_value();
     },
     [] { return madeRows(OvraTest::kNodeDatabase, "SELECT version FROM ovradrcore_db_info"); }},
    {"sessionFirst", prepareFolder, [] { return grant("eve"); },
     [] { return madeRows(kSessionsFile, "SELECT user FROM session"); }},
    {"accountFirst", prepareFolder, [] { return AccountStore().isOpen(); },
     [] { return madeRows(kAccountsFile, "SELECT count(*) FROM account"); }},
    {"releaseFirst", prepareFolder, note,
     [] { return madeRows(OvraApps::kPendingReleasesFile, "SELECT session FROM release"); }},
    {"trustFirst", prepareFolder, [] { return TrustStore().create(); },
     [] { return fileText(kKnownEndpointsFile); }},
    {"aliasFirst", prepareFolder, [] { return enrol("new"); }, [] { return fileText(kAliases); }},
    {"keyFirst", prepareFolder,
     [] { return SealKeyPair::loadOrCreate("/usr/ovra/var/ovradr/seal").has_value(); },
     [] {
         const char *const path = "/usr/ovra/var/ovradr/seal";
         return std::string(SealKeyPair::load(path) ? "key" : (fs::exists(path) ? "bad" : "none"));
     }},
};

std::string inChild(const std::function<std::string()> &work) {
    tell(shared.text, sizeof(shared.text), "");
    OtherProcess child([&] {
        tell(shared.text, sizeof(shared.text), work());
        return 0;
    });
    return child.wait() == 0 ? shared.text : "the process died";
}

const fs::path kNode = "/usr/ovra";
const fs::path kCaches = "/tmp/.ovradrcache";
const fs::path kKept = "/tmp/ovradr-torture";

void replaceFiles(const fs::path &to, const fs::path &from) {
    fs::create_directories(to); // it may be a mount point
    for (const auto &old : fs::directory_iterator(to)) {
        fs::remove_all(old);
    }
    if (fs::exists(from)) {
        fs::copy(from, to, fs::copy_options::recursive);
    }
}

void clearNode() {
    replaceFiles(kNode, "");
    fs::remove_all(kCaches);
}
void keepNode() {
    replaceFiles(kKept / "node", kNode);
    replaceFiles(kKept / "caches", kCaches);
}
void restoreNode() {
    clearNode();
    replaceFiles(kNode, kKept / "node");
    replaceFiles(kCaches, kKept / "caches");
    fs::permissions(kCaches, fs::perms::owner_all);
}

/// Runs a scene again and again, the fault one call later each time, until it is not met.
class Sweep {
public:
    Sweep(const Scene &scene, const FaultPlan &plan)
        : scene_(scene)
        , plan_(plan) {
        tell(shared.told, sizeof(shared.told), "");
        clearNode();
        inChild([&] { return scene.prepare(), ""; });
        before_ = inChild(scene.state);
        keepNode();
        inChild([&] { return std::to_string(scene.change()); });
        after_ = inChild(scene.state);
        const bool memory = plan.fault == Fault::kNoMemory || plan.fault == Fault::kNoMemoryAtAll;
        const int step = memory && tortureScale() == 1 ? 8 : 1;
        for (calls_ = 1; calls_ < 20'000; calls_ += calls_ < 64 ? 1 : step) {
            restoreNode();
            std::string told = before_ == "id" && scene.change != makeIdentity ? shared.told : "";
            tell(shared.told, sizeof(shared.told), told);
            if (const std::string fault = once(); !fault.empty()) {
                found_.push_back("call " + std::to_string(calls_) + ": " + fault);
            }
            if (!shared.met) {
                break;
            }
        }
    }
    int calls() const { return calls_; }
    const std::vector<std::string> &found() const { return found_; }

private:
    int work() const {
        try {
            OvraTest::beginFaults(plan_, calls_);
            shared.done = scene_.change();
        } catch (const std::exception &) {
        }
        shared.met = OvraTest::endFaults();
        if (shared.done) {
            return 0;
        }
        // A lock or a descriptor that the failure left would be in the way here.
        const std::string state = scene_.state();
        return state == after_ || (state == before_ && scene_.change()) ? 0 : 1;
    }
    std::string once() {
        shared.met = true;
        shared.done = false;
        const bool deadly = plan_.fault == Fault::kKill || plan_.fault >= Fault::kPowerNewNames;
        const int code = OtherProcess([this] { return work(); }).wait();
        if (code > 0 || (code < 0 && !deadly)) {
            return code > 0 ? "after it failed, it cannot be done" : "it crashed or hung";
        }
        const std::string state = inChild(scene_.state);
        if (state != after_ && (state != before_ || shared.done)) {
            return (shared.done ? "acknowledged, but there is " : "there is ") + state;
        }
        const std::string healed = inChild([this] {
            return scene_.state() == after_ || scene_.change() ? scene_.state() : "no success";
        });
        return healed == after_ ? "" : "afterwards there is " + healed;
    }

    const Scene &scene_;
    const FaultPlan plan_;
    std::string before_;
    std::string after_;
    int calls_ = 0;
    std::vector<std::string> found_;
};

class Torture : public testing::TestWithParam<Scene> {};

} // namespace

TEST_P(Torture, LeavesTheOldOrTheNewAtEveryCall) {
    const std::pair<const char *, FaultPlan> faults[] = {
        {"killed", {Fault::kKill}},
        {"EIO", {Fault::kError, EIO}},
        {"ENOSPC", {Fault::kError, ENOSPC}},
        {"EMFILE", {Fault::kError, EMFILE}},
        {"short", {Fault::kShort}},
        {"no memory once", {Fault::kNoMemory}},
        {"no memory at all", {Fault::kNoMemoryAtAll}},
        {"power, new names", {Fault::kPowerNewNames}},
        {"power, old names", {Fault::kPowerOldNames}},
    };
    for (const auto &[name, plan] : faults) {
        if (tortureScale() == 1 && std::string_view(GetParam().name).ends_with("First") &&
            plan.fault != Fault::kKill && plan.fault != Fault::kPowerOldNames) {
            continue; // as in the other cases
        }
        const Sweep sweep(GetParam(), plan);
        std::printf("%s: %d rounds\n", name, sweep.calls());
        for (const std::string &fault : sweep.found()) {
            ADD_FAILURE() << name << ", " << fault;
        }
    }
}
INSTANTIATE_TEST_SUITE_P(Of, Torture, testing::ValuesIn(kScenes),
                         [](const auto &scene) { return std::string(scene.param.name); });

/// What the checks above are worth: each safety is switched off once, and they have to notice.
TEST(TortureChecks, NoticeASafetyThatIsSwitchedOff) {
    const struct {
        const char *scene;
        FaultPlan plan;
    } cases[] = {
        {"identityNew", {Fault::kLost}},
        {"cacheUpdate", {Fault::kLost}},
        {"nodeDelete", {Fault::kLost}},
        {"sessionGrant", {Fault::kLost}},
        {"aliasEnrolment", {Fault::kKill, 0, Lie::kRename}},
        {"trustPin", {Fault::kKill, 0, Lie::kRename}},
        {"nodeDelete", {Fault::kKill, 0, Lie::kJournal}},
        {"sessionGrant", {Fault::kKill, 0, Lie::kJournal}},
        {"identityNew", {Fault::kPowerNewNames, 0, Lie::kSync}},
        {"trustPin", {Fault::kPowerNewNames, 0, Lie::kSync}},
        {"nodeUpdate", {Fault::kPowerOldNames, 0, Lie::kSync}},
        {"accountChange", {Fault::kPowerNewNames, 0, Lie::kSync}},
    };
    for (const auto &[name, plan] : cases) {
        for (const Scene &scene : kScenes) {
            if (std::string_view(scene.name) == name) {
                EXPECT_FALSE(Sweep(scene, plan).found().empty())
                    << name << ", lie " << int(plan.lie);
            }
        }
    }
}

TEST(TortureChecks, NoticeLocksThatDoNothing) {
    const std::pair<bool (*)(int), long (*)()> cases[] = {
        {[](int i) {
             return TrustStore().pin("https://n" + std::to_string(i) + ":1",
                                     "SHA256:" + std::string(43, 'A')) == TrustVerdict::kTrusted;
         },
         [] { return static_cast<long>(TrustStore().list()->size()); }},
        {[](int i) { return DRNodeDB::SetAttr("n", "app", std::to_string(i), "value"); },
         [] {
             std::vector<DRNodeAttr> all;
             return DRNodeDB::ListAttr("n", "app", all) ? static_cast<long>(all.size()) : 0L;
         }},
    };
    for (const auto &[change, count] : cases) {
        for (const Lie lie : {Lie::kNone, Lie::kLock}) {
            clearNode();
            prepareFolder();
            ASSERT_TRUE(TrustStore().create());
            OvraTest::provisionNode();
            const auto changes = [&, change = change](int first) {
                OvraTest::beginFaults({Fault::kKill, 0, lie}, INT_MAX);
                bool done = true;
                for (int i = first; i < 100; i += 4) {
                    done = change(i) && done;
                }
                return done ? 0 : 1;
            };
            int failed = 0;
            {
                OtherProcess processes[] = {OtherProcess([&] { return changes(0); }),
                                            OtherProcess([&] { return changes(1); }),
                                            OtherProcess([&] { return changes(2); }),
                                            OtherProcess([&] { return changes(3); })};
                for (OtherProcess &process : processes) {
                    failed += process.wait() == 0 ? 0 : 1;
                }
            }
            const bool kept = failed == 0 && count() == 100;
            EXPECT_EQ(kept, lie == Lie::kNone) << failed << " failed, " << count() << " kept";
        }
    }
}

/// Processes that change something again and again, each killed at some moment, until there were
/// `changes` and a fifth as many kills. After each, `check` is told the last change acknowledged.
void killAtRandom(long changes, bool (*change)(long), void (*check)(long)) {
    std::mt19937 random(1);
    long kills = 0;
    for (shared.number = 0; shared.number < changes || kills < changes / 5; ++kills) {
        OtherProcess worker([&] {
            while (change(shared.number + 1)) {
                ++shared.number;
            }
            return 0;
        });
        usleep(static_cast<useconds_t>(random() % 5'000));
        worker.end(SIGKILL);
        check(shared.number);
        ASSERT_FALSE(testing::Test::HasFailure()) << "after " << kills << " kills";
    }
    std::printf("%ld changes, %ld kills\n", shared.number, kills);
}

TEST(TortureAtRandom, CacheUpdates) {
    killAtRandom(
        100 * tortureScale(), [](long i) { return TestCache("a").UpdateWithData(Json::Int64(i)); },
        [](long last) {
            const long found =
                std::stol("0" + inChild([] { return TestCache("a").GetCachedData().asString(); }));
            EXPECT_TRUE(found == last || found == last + 1) << found << " after " << last;
        });
}

TEST(TortureAtRandom, Identities) {
    killAtRandom(
        20 * tortureScale(),
        [](long) {
            shared.told[0] = '\0';
            return DRNode::resetLocalNodeId() && makeIdentity();
        },
        [](long) {
            const std::string found = inChild(identity);
            EXPECT_TRUE(found == "id" || (found == "none" && shared.told[0] == '\0')) << found;
            EXPECT_EQ(inChild([] { return makeIdentity() ? identity() : "no success"; }), "id");
        });
}
