// SPDX-License-Identifier: Apache-2.0
#include "measure.h"

#include <ovradrcore/cache.h>

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <cstdlib>

namespace OvraBench {

namespace {

constexpr const char *kFloorFile = "/tmp/.ovradrcache/floor";
/// The most that one update of a cache file writes: one copy of a bucket.
constexpr std::size_t kBlock = 4096;

class BenchCache : public OvraDRCore::Cache {
public:
    BenchCache(const std::string &path, int entry)
        : Cache(path, "conn_https_5001_10.0.0." + std::to_string(entry), 3600, false, 3) {}
    Json::Value GetInfo() const override { return {}; }
    bool GetUpdatedData(Json::Value &) const override { return false; }
    bool IsValid(const Json::Value &value) const override { return value.isBool(); }
};

/// Open, lock, read or write, close: the cost of any file shared by processes.
void floorOperation(bool write) {
    static std::array<char, kBlock> block{};
    const int fd = open(kFloorFile, O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    flock(fd, write ? LOCK_EX : LOCK_SH);
    const ssize_t done = write ? pwrite(fd, block.data(), block.size(), 0)
                               : pread(fd, block.data(), block.size(), 0);
    close(fd);
    if (done < 0) {
        std::perror("floor");
        std::exit(1);
    }
}

std::string filled(int entries) {
    const std::string path = "/tmp/.ovradrcache//bench_" + std::to_string(entries);
    for (int i = 0; i < entries; ++i) {
        if (!BenchCache(path, i).UpdateWithData(true)) {
            std::fprintf(stderr, "cannot fill %s\n", path.c_str());
            std::exit(1);
        }
    }
    return path;
}

} // namespace

bool benchCache() {
    constexpr int kFew = 10;
    constexpr int kMany = 100000;
    constexpr int kCalls = 4000;
    constexpr int kRounds = 15;
    const std::string few = filled(kFew);
    const std::string many = filled(kMany);
    floorOperation(true);

    const auto read = [](const std::string &path, int entries) {
        return [path, entries, next = 0]() mutable {
            next = (next + 7919) % entries; // strides over the file
            if (!BenchCache(path, next).Read().isBool()) {
                std::abort();
            }
        };
    };
    const auto update = [](const std::string &path, int entries) {
        return [path, entries, next = 0]() mutable {
            next = (next + 7919) % entries;
            if (!BenchCache(path, next).UpdateWithData(true)) {
                std::abort();
            }
        };
    };
    const Work floorRead = [] { floorOperation(false); };
    const Work floorWrite = [] { floorOperation(true); };
    bool good = true;
    const auto row = [&](const char *what, const Work &ours, const Work &floor, double bound) {
        good = report(what, compare(kCalls, kRounds, ours, floor), bound) && good;
    };
    row("cache read hit, 10 entries / open, lock, pread, close", read(few, kFew), floorRead, 3);
    row("cache read hit, 100,000 entries / the same", read(many, kMany), floorRead, 3);
    row("cache read hit, 100,000 entries / 10 entries", read(many, kMany), read(few, kFew), 1.3);
    row("cache update, 10 entries / open, lock, pwrite, close", update(few, kFew), floorWrite, 3);
    row("cache update, 100,000 entries / the same", update(many, kMany), floorWrite, 3);
    row("cache update, 100,000 entries / 10 entries", update(many, kMany), update(few, kFew), 1.3);
    return good;
}

} // namespace OvraBench
