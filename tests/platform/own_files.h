// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "support/other_process.h"

#include <ovraplatform/appliance.h>

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <string>

namespace OvraTest {

inline void writeFile(const std::string &path, const std::string &content) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << content;
}

inline std::string readFile(const std::string &path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

inline unsigned int modeOf(const std::string &path) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0 ? status.st_mode & 07777U : 0U;
}

/// A fixture with its own folder. The fixed paths of the appliance may be used too.
class OwnFiles : public testing::Test {
protected:
    void SetUp() override {
        std::string pattern = "/tmp/ovrat.XXXXXX";
        ASSERT_NE(mkdtemp(pattern.data()), nullptr);
        folder_ = pattern;
    }
    void TearDown() override {
        std::filesystem::remove_all(folder_);
        std::filesystem::remove_all(OvraPlatform::kConfigDir);
        std::filesystem::remove_all(OvraPlatform::kStateDir);
        umask(022);
    }

    std::string path(const std::string &name) const { return folder_ + "/" + name; }

private:
    std::string folder_;
};

/// From here on this process can write no file beyond `bytes`, as on a full disk.
inline void limitFileSize(rlim_t bytes) {
    std::signal(SIGXFSZ, SIG_IGN); // so that write(2) fails instead
    const rlimit limit{bytes, bytes};
    setrlimit(RLIMIT_FSIZE, &limit);
}

} // namespace OvraTest
