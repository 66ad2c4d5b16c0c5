// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <sys/mount.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <string>
#include <system_error>
#include <utility>

namespace OvraTest {

namespace fs = std::filesystem;

/// A small disk in the place of a folder, with its contents; for a process with a view of its own
/// (enterView()).
class Disk {
public:
    explicit Disk(std::string folder)
        : folder_(std::move(folder)) {
        constexpr const char *kKept = "/tmp/kept";
        constexpr auto kAll = fs::copy_options::recursive | fs::copy_options::copy_symlinks;
        struct stat status {};
        fs::remove_all(kKept);
        fs::copy(folder_, kKept, kAll);
        mustSucceed(stat(folder_.c_str(), &status));
        mustSucceed(mount("none", folder_.c_str(), "tmpfs", 0, "size=1m,nr_inodes=128"));
        fs::copy(kKept, folder_, kAll);
        mustSucceed(chmod(folder_.c_str(), status.st_mode & 07777U));
    }
    Disk(const Disk &) = delete;
    Disk &operator=(const Disk &) = delete;
    ~Disk() { umount2(folder_.c_str(), MNT_DETACH); }

    /// Fills it, but for so many pages.
    void leavePages(std::size_t pages) const {
        const std::string page(kPage, 'x');
        const std::string path = folder_ + "/filler";
        std::ofstream file(path, std::ios::binary);
        while (file.write(page.data(), kPage).flush()) {
        }
        fs::resize_file(path, fs::file_size(path) - pages * kPage);
    }
    void takeInodes() const {
        for (int i = 0; std::ofstream(folder_ + "/filler" + std::to_string(i)); ++i) {
        }
    }
    void setReadOnly(bool on) const {
        const unsigned long flags = on ? (MS_REMOUNT | MS_RDONLY) : +MS_REMOUNT;
        mustSucceed(mount("none", folder_.c_str(), nullptr, flags, nullptr));
    }
    /// Takes back what was done to it.
    void mend() const {
        setReadOnly(false);
        for (const auto &entry : fs::directory_iterator(folder_)) {
            if (entry.path().filename().string().rfind("filler", 0) == 0) {
                fs::remove(entry.path());
            }
        }
    }

private:
    static constexpr std::size_t kPage = 4096;
    static void mustSucceed(int result) {
        if (result != 0) {
            throw std::system_error(errno, std::generic_category(), "a disk for the test");
        }
    }
    std::string folder_;
};

} // namespace OvraTest
