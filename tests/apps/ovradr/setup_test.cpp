// SPDX-License-Identifier: Apache-2.0
#include "program.h"
#include "support/local_node.h"

#include <gtest/gtest.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>

#include <list>
#include <memory>
#include <set>

namespace OvradrTest {

namespace {

using OvraTest::executeSql;
using OvraTest::kIdentityFile;
using OvraTest::kNodeDatabase;
using OvraTest::querySql;

constexpr const char *kSettings = "/usr/ovra/etc/ovradr/ovradrd.conf";
constexpr const char *kKey = "/usr/ovra/etc/ovradr/ovradrd.key";
constexpr const char *kCertificate = "/usr/ovra/etc/ovradr/ovradrd.crt";
constexpr const char *kSealKey = "/usr/ovra/etc/ovradr/ovradrd.seal";

/// The whole content of the files that a set-up makes.
std::string allFiles() {
    return readFile(kSettings) + readFile(kKey) + readFile(kCertificate) + readFile(kSealKey) +
           readFile(kIdentityFile) + readFile(kNodeDatabase);
}

/// The steps of a set-up that made something.
std::string madeBy(const Json::Value &answer) {
    std::string all;
    for (const Json::Value &step : answer["data"]["steps"]) {
        all += step["made"].asBool() ? step["what"].asString() + ", " : "";
    }
    return all;
}

} // namespace

TEST(Setup, MakesAWholeApplianceAndTheSecondTimeNothing) {
    const Result first = run({"setup", "--json", "--hostname", "nas1"});
    ASSERT_EQ(first.exit, 0) << first.out << first.err;
    EXPECT_EQ(madeBy(first.json())
                  .rfind("settings, node database, HTTPS key, HTTPS certificate, "
                         "sealing key, trusted keys, node id, ",
                         0),
              0U)
        << first.out;
    const std::string before = allFiles();

    const Result second = run({"setup", "--json"});
    ASSERT_EQ(second.exit, 0) << second.out;
    EXPECT_EQ(madeBy(second.json()), "");
    EXPECT_EQ(second.json()["data"]["node_id"], first.json()["data"]["node_id"]);
    EXPECT_EQ(second.json()["data"]["fingerprints"], first.json()["data"]["fingerprints"]);
    EXPECT_EQ(allFiles(), before);
}

TEST(Setup, MakesACertificateForTheNamesOfTheAppliance) {
    ASSERT_EQ(
        run({"setup", "--hostname", "nas1.example", "--address", "127.0.1.1,2001:db8::7"}).exit, 0);
    FILE *file = std::fopen(kCertificate, "r");
    const std::shared_ptr<X509> certificate(PEM_read_X509(file, nullptr, nullptr, nullptr),
                                            X509_free);
    std::fclose(file);
    ASSERT_TRUE(certificate);
    EXPECT_EQ(X509_check_host(certificate.get(), "nas1.example", 0, 0, nullptr), 1);
    EXPECT_EQ(X509_check_ip_asc(certificate.get(), "127.0.1.1", 0), 1);
    EXPECT_EQ(X509_check_ip_asc(certificate.get(), "2001:db8::7", 0), 1);
    EXPECT_EQ(X509_check_ip_asc(certificate.get(), "127.0.1.2", 0), 0);
    std::time_t nineYears = std::time(nullptr) + 9L * 365 * 24 * 3600;
    EXPECT_GT(X509_cmp_time(X509_get0_notAfter(certificate.get()), &nineYears), 0);
    EXPECT_LT(X509_cmp_current_time(X509_get0_notBefore(certificate.get())), 0);
}

TEST(Setup, FillsAnEmptyDatabaseThatACrashLeftAndKeepsWhatItHolds) {
    writeFile(kNodeDatabase, "");
    EXPECT_NE(madeBy(run({"setup", "--json"}).json()).find("node database, "), std::string::npos);
    OvraTest::addCred("node_cred", "node", "cred", "https", 5001, "session");
    chmod(kNodeDatabase, 0644);
    ASSERT_EQ(run({"setup"}).exit, 0);
    EXPECT_EQ(querySql("SELECT cred_id FROM node_cred"), "cred\n");
    EXPECT_EQ(modeOf(kNodeDatabase), 0600U) << "it holds sessions";
}

TEST(Setup, RefusesADatabaseThatIsNotItsOwnAndLeavesIt) {
    const std::tuple<const char *, const char *, const char *> cases[] = {
        {"without a version", "DELETE FROM ovradrcore_db_info", "not one that"},
        {"without a table", "DROP TABLE temp_cred", "not one that"},
        {"with other columns", "ALTER TABLE node_cred RENAME COLUMN session TO sid",
         "not one that"},
    };
    for (const auto &[what, sql, told] : cases) {
        std::filesystem::remove(kNodeDatabase);
        ASSERT_EQ(run({"setup"}).exit, 0);
        executeSql(sql);
        const std::string before = readFile(kNodeDatabase);
        const Result result = run({"setup"});
        EXPECT_EQ(result.exit, 9) << what;
        EXPECT_NE(result.err.find(told), std::string::npos) << what << result.err;
        EXPECT_EQ(readFile(kNodeDatabase), before) << what;
    }
    writeFile(kNodeDatabase, std::string(5000, 'x'));
    EXPECT_EQ(run({"setup"}).exit, 9);
    EXPECT_EQ(readFile(kNodeDatabase), std::string(5000, 'x'));
}

TEST(Setup, RefusesAKeyOrCertificateThatDoesNotFitAndLeavesIt) {
    ASSERT_EQ(run({"setup"}).exit, 0);
    const std::string certificate = readFile(kCertificate);
    const std::string key = readFile(kKey);
    std::filesystem::remove(kKey);
    EXPECT_EQ(run({"setup"}).exit, 9) << "the new key is not the certificate's";
    EXPECT_EQ(readFile(kCertificate), certificate);
    writeFile(kKey, "rubbish");
    EXPECT_EQ(run({"setup"}).exit, 9);
    EXPECT_EQ(readFile(kKey), "rubbish");
    writeFile(kKey, key);
    EXPECT_EQ(run({"setup"}).exit, 0);
}

TEST(Setup, ManyAtOnceMakeOneAppliance) {
    std::list<Program> programs;
    for (int i = 0; i < 6; ++i) {
        programs.emplace_back(Arguments{"setup", "--json"});
    }
    std::set<Json::Value> fingerprints;
    for (Program &program : programs) {
        const Result result = program.finish();
        ASSERT_EQ(result.exit, 0) << result.out;
        fingerprints.insert(result.json()["data"]["fingerprints"]);
    }
    EXPECT_EQ(fingerprints.size(), 1U);
    EXPECT_EQ(querySql("SELECT count(*) FROM ovradrcore_db_info"), "1\n");
}

TEST(Setup, ChangesOnlyTheSettingsThatAreGiven) {
    ASSERT_EQ(run({"setup", "--serial", "A1", "--http-port", "8080"}).exit, 0);
    ASSERT_EQ(run({"setup", "--https-port", "8443"}).exit, 0);
    EXPECT_EQ(readFile(kSettings), "serial=\"A1\"\nhttp_port=\"8080\"\nhttps_port=\"8443\"\n");
}

TEST(Setup, RefusesSettingsWithWhichItCouldNotServe) {
    const std::pair<const char *, std::string> refused[] = {
        {"--http-port", "0"},
        {"--https-port", "65536"},
        {"--http-port", "5001"},
        {"--hostname", "nas 1"},
        {"--hostname", "nas\n1"},
        {"--address", "nas1"},
        {"--address", "127.0.0.1,,x"},
        {"--serial", "a\"b"},
        {"--serial", std::string(65, 'a')},
    };
    for (const auto &[option, value] : refused) {
        EXPECT_EQ(run({"setup", option, value}).exit, 2) << option << value;
        EXPECT_FALSE(std::filesystem::exists(kSettings));
    }
    writeFile(kSettings, "http_port=\"many\"\n");
    const Result result = run({"setup"});
    EXPECT_EQ(result.exit, 9);
    EXPECT_NE(result.err.find("http_port is [many]"), std::string::npos) << result.err;
}

TEST(NodeDatabase, OfTwoWritersOfOneAttributeTheLaterStays) {
    ASSERT_EQ(run({"setup"}).exit, 0);
    executeSql(
        "INSERT INTO node_attr VALUES ('n', 'app', 'a', 'first'), ('n', 'app', 'a', 'second')");
    EXPECT_EQ(querySql("SELECT value FROM node_attr"), "second\n");
}

TEST(NodeId, IsMadeAnewOnlyWhenItIsMeant) {
    const std::string id = run({"node", "id"}).out;
    EXPECT_EQ(run({"node", "id", "--reset"}).exit, 2) << "nobody can be asked";

    Terminal hesitant({"node", "id", "--reset"});
    ASSERT_TRUE(hesitant.answers("[y/N]", ""));
    EXPECT_EQ(hesitant.finish(), 1);
    EXPECT_EQ(run({"node", "id"}).out, id);

    EXPECT_NE(run({"node", "id", "--reset", "--yes"}).out, id);
    EXPECT_NE(readFile(kIdentityFile)
                  .find(run({"node", "id", "--json"}).json()["data"]["node_id"].asString()),
              std::string::npos);
}

} // namespace OvradrTest
