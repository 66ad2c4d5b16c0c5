// SPDX-License-Identifier: Apache-2.0
#include "platform/store/raw_sqlite.h"
#include "scene.h"
#include "shared/invites.h"
#include "shared/pending_releases.h"
#include "support/local_node.h"

#include <ovraplatform/session_store.h>

#include <gtest/gtest.h>

#include <cstdlib>

// The files that a version left must be understood by every later one, and left alone by every
// earlier one. tests/fixtures holds them, an archive a format; tests/fixtures/make makes one.

namespace OvradrTest {

namespace {

using OvraApps::PendingReleases;
using OvraTest::RawSqlite;

constexpr const char *kAliases = "/usr/ovra/var/farlinkd/aliases";
const std::string kConfig = "/usr/ovra/etc/ovradr/";
const std::string kState = "/usr/ovra/var/ovradr/";

/// What each place that a file has is asked for: the program's answer to a command that uses it.
std::string askEverything() {
    std::string all;
    for (const Arguments &command : {Arguments{"setup"},
                                     {"user", "list"},
                                     {"session", "pending"},
                                     {"invite", "--list"},
                                     {"node", "list"},
                                     {"attr", "get", "local", "app", "name"},
                                     {"attr", "set", "local", "app", "other", "v"},
                                     {"session", "list"},
                                     {"conn", "local"}}) {
        const Result result = run(command);
        all += result.out + result.err;
    }
    OvraTest::DaemonProgram relay(
        {FARLINKD_PROGRAM, "--address", "127.0.0.1", "--port", "0", "--tunnel-port", "0"});
    all += relay.line();
    relay.end(SIGTERM);
    return all + useDaemon();
}

constexpr char kTrustHeading[] = "# ovradr-trust 1\n";

/// The contents of the files that nothing has a reason to write; setup gives that of trusted keys
/// its heading.
std::string unchangeable() {
    std::string all = readFile(kState + "known_endpoints");
    all.erase(0, all.rfind(kTrustHeading, 0) == 0 ? std::strlen(kTrustHeading) : 0);
    all += readFile(kAliases);
    for (const char *name : {"node.info", "ovradrd.key", "ovradrd.crt", "ovradrd.seal"}) {
        all += readFile(kConfig + name);
    }
    return all;
}

bool holds(const std::string &text, const std::string &part) {
    return text.find(part) != std::string::npos;
}

} // namespace

/// Run by tests/fixtures/make, which keeps what is then there.
TEST(Fixtures, DISABLED_AreMade) {
    startAnew();
    ASSERT_EQ(run({"setup", "--serial", "A1", "--hostname", "nas1"}).exit, 0);
    ASSERT_EQ(run({"user", "add", "ann", "--admin", "--password-stdin"}, "correct horse").exit, 0);
    ASSERT_EQ(run({"attr", "set", "local", "app", "name", "value"}).exit, 0);
    OvraTest::addCred("node_cred", "n1", "c1", "https", 5001, "a session");
    ASSERT_TRUE(PendingReleases().note({"a session", {}, "n1", "c1"}));
    ASSERT_TRUE(OvraApps::Invites().make("ann", 60));
    ASSERT_TRUE(OvraPlatform::SessionStore().create({"ann", "", "", "", "", -1, true}));
    writeFile(kState + "known_endpoints",
              kTrustHeading + ("https://192.0.2.1:5001 SHA256:" + std::string(42, 'x')) +
                  "A\nhttps://192.0.2.2:5001 system\nflk:nas2 forgotten\n");
    writeFile(kConfig + "farlink.conf", "host=\"relay.example\"\nport=\"5443\"\nalias=\"nas1\"\n");
    writeFile(kAliases,
              "farlink-aliases-1 20001\nnas1 20000 4102444800 " + std::string(43, 'k') + "\n");
    chmod(kAliases, 0600);
    chmod((kState + "known_endpoints").c_str(), 0600);
    chmod("/usr/ovra/var/farlinkd", 0700);
    useLibrary();
}

TEST(FilesOfThisAndOlderVersions, AreRead) {
    int archives = 0;
    for (const auto &entry : fs::directory_iterator(OVRA_FIXTURES)) {
        if (entry.path().extension() != ".gz") {
            continue;
        }
        ++archives;
        unpack(entry.path());
        const std::string kept = unchangeable();
        const std::string told = askEverything();
        for (const char *part :
             {"ann   administrator", "n1", "value", "nas1", "farlinkd: ready", "ovradrd: ready"}) {
            EXPECT_TRUE(holds(told, part)) << entry.path() << ": " << part << "\n" << told;
        }
        std::vector<OvraApps::PendingRelease> notes;
        EXPECT_TRUE(PendingReleases().list(notes) && notes.size() == 1) << entry.path();
        std::vector<OvraPlatform::SessionRecord> sessions;
        EXPECT_TRUE(OvraPlatform::SessionStore().list(sessions) && sessions.size() == 1);
        EXPECT_EQ(unchangeable(), kept) << entry.path();
    }
    EXPECT_GT(archives, 0);
}

TEST(FilesOfANewerVersion, AreRefusedAndLeftAsTheyAre) {
    const auto sql = [](const char *statement) {
        return
            [statement](const std::string &path) { EXPECT_TRUE(RawSqlite(path).run(statement)); };
    };
    const auto heading = [](const std::string &path) {
        std::string text = readFile(path);
        text.replace(text.find(' ') - 1, 1, "9");
        writeFile(path, text);
    };
    const std::function<void(const std::string &)> nextLayout = sql("PRAGMA user_version = 99");
    const std::tuple<std::string, std::function<void(const std::string &)>, const char *> cases[] =
        {
            {kConfig + "node.db", sql("UPDATE ovradrcore_db_info SET version = 2"), "newer"},
            {kState + "accounts.db", nextLayout, "layout 99"},
            {kState + "sessions.db", nextLayout, "layout 99"},
            {kState + "releases.db", nextLayout, "layout 99"},
            {kState + "invites.db", nextLayout, "layout 99"},
            {kConfig + "ovradrd.seal", heading, "ovradrd.seal"},
            {kAliases, heading, "aliases"},
            {kState + "known_endpoints",
             [](const std::string &path) { writeFile(path, "# ovradr-trust 2\n"); }, "newer"},
        };
    for (const auto &[path, change, told] : cases) {
        unpack(newestArchive());
        change(path);
        const std::string before = readFile(path);
        const std::string answer = askEverything();
        EXPECT_TRUE(holds(answer, told)) << path << "\n" << answer;
        using namespace OvraDRNode;
        const bool changed = DRNodeDB::SetAttr("n1", "app", "name", "new") ||
                             DRNodeDB::SetConn("c1", Conn("192.0.2.9", "https", 1)) ||
                             DRNodeDB::Delete("n1");
        EXPECT_EQ(changed, path != kConfig + "node.db") << path;
        if (path == kConfig + "node.db") {
            std::vector<DRNode> nodes;
            DRNodeDB::List(nodes, DRNodeDB::CRED_TYPE_NODE);
            EXPECT_TRUE(nodes.empty());
        }
        EXPECT_EQ(readFile(path), before) << path;
    }
}

} // namespace OvradrTest
