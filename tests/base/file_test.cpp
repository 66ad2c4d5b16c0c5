// SPDX-License-Identifier: Apache-2.0
#include <ovrabase/file.h>

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>

using namespace OvraBase;

namespace {

class Files : public testing::Test {
protected:
    Files() { std::filesystem::create_directories(folder); }
    ~Files() override { std::filesystem::remove_all(folder); }

    std::string path(const std::string &name) const { return folder + "/" + name; }
    static void put(const std::string &path, const std::string &content, mode_t mode = 0600) {
        std::ofstream(path) << content;
        chmod(path.c_str(), mode);
    }
    static mode_t modeOf(const std::string &path) {
        struct stat status {};
        return stat(path.c_str(), &status) == 0 ? status.st_mode & 07777U : 0;
    }

    const std::string folder = "/tmp/file_test";
};

} // namespace

TEST_F(Files, AreReadWholeOrNotAtAll) {
    put(path("text"), std::string(20'000, 'x'));
    EXPECT_EQ(readFile(path("text")).value(), std::string(20'000, 'x'));
    put(path("large"), std::string(kMaxTextFile + 1, 'x'));
    EXPECT_EQ(readFile(path("large")).error().number, EFBIG);
    EXPECT_EQ(readFile(path("missing")).error().number, ENOENT);
    EXPECT_EQ(readFile(folder).error().number, EINVAL);
    ASSERT_EQ(mkfifo(path("pipe").c_str(), 0600), 0);
    EXPECT_EQ(readFile(path("pipe")).error().number, EINVAL) << "must not wait for a writer";
    put(path("open"), "x", 0666);
    EXPECT_EQ(readFile(path("open")).error().number, EPERM) << "somebody else may have written it";
}

TEST_F(Files, ThatArePrivateAreReadByTheirOwnerOnlyAndThroughNoLink) {
    put(path("key"), "secret");
    EXPECT_EQ(readPrivateFile(path("key"), Links::kRefuse).value().get(), "secret");
    ASSERT_EQ(symlink(path("key").c_str(), path("link").c_str()), 0);
    EXPECT_EQ(readPrivateFile(path("link"), Links::kRefuse).error().number, ELOOP);
    EXPECT_EQ(readPrivateFile(path("link"), Links::kFollow).value().get(), "secret");
    chmod(path("key").c_str(), 0640);
    EXPECT_EQ(readPrivateFile(path("key"), Links::kRefuse).error().number, EPERM);
    put(path("empty"), "");
    EXPECT_TRUE(readPrivateFile(path("empty"), Links::kRefuse).value().empty());
}

TEST_F(Files, ThatExistAreNeverReplacedByCreation) {
    umask(0);
    EXPECT_TRUE(createFile(path("new"), "first", 0640).value());
    EXPECT_FALSE(createFile(path("new"), "second", 0600).value());
    EXPECT_EQ(readFile(path("new")).value(), "first");
    EXPECT_EQ(modeOf(path("new")), 0640U);
    EXPECT_EQ(createFile(path("missing/new"), "", 0600).error().number, ENOENT);
    const auto entries = std::filesystem::directory_iterator(folder);
    EXPECT_EQ(std::distance(begin(entries), end(entries)), 1) << "something was left behind";
}

TEST_F(Files, KeepTheirModeWhenTheyAreReplacedAsNoFolderEverIs) {
    put(path("settings"), "old", 0640);
    ASSERT_EQ(symlink(path("settings").c_str(), path("link").c_str()), 0);
    EXPECT_EQ(FileUpdate::begin(path("link"))->commit("new", 0600).error().number, ELOOP);
    EXPECT_EQ(readFile(path("settings")).value(), "old");
    ASSERT_TRUE(FileUpdate::begin(path("settings")).value().commit("new", 0600));
    EXPECT_EQ(readFile(path("settings")).value(), "new");
    EXPECT_EQ(modeOf(path("settings")), 0640U);
    chmod(path(".lock").c_str(), 0666);
    EXPECT_EQ(FileUpdate::begin(path("settings")).error().number, EPERM) << "others could hold it";
    std::filesystem::remove(path(".lock"));
    ASSERT_TRUE(FileUpdate::begin(path("fresh")).value().commit("x", 0600));
    EXPECT_EQ(modeOf(path("fresh")), 0600U);
    std::filesystem::create_directory(path("folder"));
    const auto update = FileUpdate::begin(path("folder"));
    EXPECT_EQ(update->commit("x", 0600).error().number, EINVAL);
    EXPECT_FALSE(std::filesystem::exists(path("folder.new")));
    EXPECT_EQ(folderOf("/a//b"), "/a");
    EXPECT_EQ(folderOf("/a"), "/");
    EXPECT_EQ(folderOf("a"), ".");
}
