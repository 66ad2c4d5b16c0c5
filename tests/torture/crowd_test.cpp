// SPDX-License-Identifier: Apache-2.0
// A crowd of processes, with threads in them, over the same cache file, node database and identity.
// Each thread has entries of its own, which share buckets and pages with those of all others, and
// all write one more together.
#include "faults/faults.h"
#include "support/local_node.h"
#include "support/other_process.h"
#include "support/soon.h"
#include "support/torture.h"

#include <ovradrcore/cache.h>
#include <ovradrnode/node_db.h>

#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/mman.h>

#include <array>
#include <atomic>
#include <climits>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <list>
#include <map>
#include <new>
#include <random>
#include <set>
#include <thread>
#include <vector>

using namespace OvraDRNode;
using OvraTest::Lie;
using std::chrono::milliseconds;
using std::chrono::steady_clock;

namespace {

namespace fs = std::filesystem;

constexpr std::size_t kProcesses = 32;
constexpr std::size_t kThreads = 6; // two for each store, and two for the identity
constexpr std::size_t kWriters = kProcesses * kThreads;
constexpr char kCacheFolder[] = "/tmp/.ovradrcache";
constexpr char kEverybody[] = "everybody";

class TestCache : public OvraDRCore::Cache {
public:
    explicit TestCache(const std::string &name)
        : Cache("/tmp/.ovradrcache//crowd", name, 1000, false, 3) {}
    Json::Value GetInfo() const override { return {}; }
    bool GetUpdatedData(Json::Value &) const override { return false; }
    bool IsValid(const Json::Value &) const override { return true; }
};

bool setAttr(const std::string &name, const std::string &value) {
    return DRNodeDB::SetAttr("n1", "crowd", name, value);
}
std::string attr(const std::string &name) {
    std::string value;
    return DRNodeDB::GetAttr("n1", "crowd", name, value) ? value : "";
}
bool setCached(const std::string &name, const std::string &value) {
    return TestCache(name).UpdateWithData(value);
}
std::string cached(const std::string &name) {
    return TestCache(name).GetCachedData().asString();
}

/// What keeps named values.
struct Store {
    const char *name;
    bool (*set)(const std::string &name, const std::string &value);
    std::string (*get)(const std::string &name);
    std::chrono::seconds bound; ///< of one operation: how long it waits for a lock
};
const Store kStores[] = {{"caches", setCached, cached, std::chrono::seconds(2)},
                         {"node.db", setAttr, attr, std::chrono::seconds(20)}};
constexpr std::size_t kIdentity = 2;
constexpr std::chrono::seconds kIdentityBound{5};

/// Shared by the processes.
struct Board {
    std::atomic<bool> stop{false};
    struct Of {
        std::atomic<long> operations{0};
        std::atomic<long> longest{0}; ///< milliseconds
        std::atomic<int> refused{0};  ///< updates that were
        std::atomic<int> faults{0};
        char first[300]{}; ///< the first fault
        std::array<long, kWriters> acknowledged{};
    };
    std::array<Of, 3> of; ///< the stores, and the identity

    void fault(std::size_t which, const std::string &what) {
        if (of.at(which).faults++ == 0) {
            std::strncpy(of.at(which).first, what.c_str(), sizeof(Of::first) - 1);
        }
    }
    template <typename Work>
    auto time(std::size_t which, const Work &work) {
        const auto begun = steady_clock::now();
        auto result = work();
        const long took = (steady_clock::now() - begun) / milliseconds(1);
        auto &longest = of.at(which).longest;
        for (long known = longest; took > known && !longest.compare_exchange_weak(known, took);) {
        }
        ++of.at(which).operations;
        return result;
    }
};

/// Up to 700 bytes that show who wrote them, and whether they are whole.
std::string text(std::size_t writer, long number) {
    const std::string id = std::to_string(writer) + " " + std::to_string(number) + " ";
    return id + std::string(static_cast<std::size_t>(number * 37 % 700), 'x') + ".";
}

class Writer {
public:
    Writer(Board &board, std::size_t id)
        : board_(board)
        , id_(id) {}

    void work(milliseconds pause) {
        for (number_ = 1; !board_.stop; ++number_) {
            const std::size_t which = id_ % 3;
            which == kIdentity ? useIdentity() : useStore(which);
            std::this_thread::sleep_for(pause);
        }
    }

private:
    void useStore(std::size_t which) {
        const Store &store = kStores[which];
        const std::string mine = text(id_, number_);
        for (const std::string &name : {"of " + std::to_string(id_), std::string(kEverybody)}) {
            if (!board_.time(which, [&] { return store.set(name, mine); })) {
                ++board_.of.at(which).refused;
                continue;
            }
            const std::string found = board_.time(which, [&] { return store.get(name); });
            if (name != kEverybody) {
                board_.of.at(which).acknowledged.at(id_) = number_;
                if (found != mine) {
                    board_.fault(which, "[" + found + "] after [" + mine + "]");
                }
            }
            std::size_t writer = 0;
            long number = 0;
            if (std::sscanf(found.c_str(), "%zu %ld ", &writer, &number) != 2 ||
                found != text(writer, number)) {
                board_.fault(which, "half a value: [" + found + "]");
            } else if (long &seen = seen_[{which, writer}]; number < seen) {
                board_.fault(which, found + ", an old value, after " + std::to_string(seen));
            } else {
                seen = number;
            }
        }
    }

    void useIdentity() {
        if (id_ == kIdentity && number_ % 10 == 0 && !DRNode::resetLocalNodeId()) {
            board_.fault(kIdentity, "not reset");
        }
        const std::string id = board_.time(kIdentity, DRNode::getLocalNodeId);
        if (id.size() != 36) {
            board_.fault(kIdentity, "[" + id + "]");
        }
        std::ifstream file(OvraTest::kIdentityFile);
        const std::string read(std::istreambuf_iterator<char>(file), {});
        if (file.is_open() && (read.size() != 47 || read.compare(0, 9, "node_id=\"") != 0)) {
            board_.fault(kIdentity, "half a file: [" + read + "]");
        }
    }

    Board &board_;
    const std::size_t id_;
    long number_ = 0;
    std::map<std::pair<std::size_t, std::size_t>, long> seen_; ///< by store and writer
};

/// The crowd at work, as long as `wait` waits.
/// \param pause  of each thread after each round
/// \param lie    a safety that is switched off
/// \return what it did
template <typename Wait>
std::unique_ptr<Board, void (*)(Board *)> play(milliseconds pause, Lie lie, const Wait &wait) {
    constexpr int kProtection = PROT_READ | PROT_WRITE;
    std::unique_ptr<Board, void (*)(Board *)> board(
        new (mmap(nullptr, sizeof(Board), kProtection, MAP_SHARED | MAP_ANONYMOUS, -1, 0)) Board,
        [](Board *memory) { munmap(memory, sizeof(Board)); });
    std::list<OvraTest::OtherProcess> crowd;
    for (std::size_t process = 0; process < kProcesses; ++process) {
        crowd.emplace_back([&, process] {
            OvraTest::beginFaults({OvraTest::Fault::kKill, 0, lie}, INT_MAX); // far from reached
            std::vector<std::thread> threads;
            for (std::size_t thread = 0; thread < kThreads; ++thread) {
                threads.emplace_back(&Writer::work, Writer(*board, process * kThreads + thread),
                                     pause);
            }
            for (std::thread &thread : threads) {
                thread.join();
            }
            return 0;
        });
    }
    wait(*board);
    board->stop = true;
    for (OvraTest::OtherProcess &process : crowd) {
        if (process.wait() != 0) {
            board->fault(0, "a process died or hung");
        }
    }
    for (std::size_t writer = 0; writer < kWriters; ++writer) {
        if (const std::size_t which = writer % 3; which != kIdentity) {
            const std::string last = text(writer, board->of[which].acknowledged[writer]);
            const std::string found = kStores[which].get("of " + std::to_string(writer));
            if (found != last) {
                board->fault(which, "at the end [" + found + "] instead of [" + last + "]");
            }
        }
    }
    return board;
}

void prepare() {
    fs::remove_all(kCacheFolder);
    fs::remove(OvraTest::kNodeDatabase);
    OvraTest::provisionNode();
    setAttr(kEverybody, text(0, 0)); // the first one would have to be inserted by all
}

} // namespace

TEST(Crowd, LosesNoUpdateReadsNoHalfValueWaitsNotTooLongAndLeavesNothing) {
    prepare();
    const std::chrono::seconds duration(std::min(2 * OvraTest::tortureScale(), 60));
    // Locks shall be scarce, not processors. Meanwhile others come and are killed.
    const auto board = play(milliseconds(10), Lie::kNone, [duration](const Board &) {
        std::mt19937 random(1);
        for (const auto end = steady_clock::now() + duration; steady_clock::now() < end;) {
            const OvraTest::OtherProcess victim([] {
                for (int i = 0;; ++i) {
                    setCached(std::to_string(i % 500), std::string(200, 'v'));
                    setAttr("victim", std::to_string(i));
                }
                return 0;
            });
            std::this_thread::sleep_for(std::chrono::microseconds(500 + random() % 20'000));
        }
    });
    for (std::size_t which = 0; which <= kIdentity; ++which) {
        const Board::Of &of = board->of[which];
        const char *const name = which < kIdentity ? kStores[which].name : "identity";
        const auto bound = which < kIdentity ? kStores[which].bound : kIdentityBound;
        std::printf("%s: %ld operations, %d refused, the longest %ld ms\n", name,
                    of.operations.load(), of.refused.load(), of.longest.load());
        EXPECT_EQ(of.faults, 0) << name << ", " << of.first;
        EXPECT_GT(of.operations, kWriters) << name;
        EXPECT_LE(of.refused * 100, of.operations) << name;
        EXPECT_LE(of.longest, 2 * bound / milliseconds(1)) << name; // a change is two statements
    }
    EXPECT_EQ(OvraTest::querySql("PRAGMA integrity_check"), "ok\n");
    std::set<std::string> left;
    for (const char *folder : {kCacheFolder, "/run/lock", "/usr/ovra/etc/ovradr"}) {
        for (const auto &entry : fs::directory_iterator(folder)) {
            left.insert(entry.path().filename());
            const int fd = open(entry.path().c_str(), O_RDONLY);
            EXPECT_EQ(flock(fd, LOCK_EX | LOCK_NB), 0) << entry.path();
            close(fd);
        }
    }
    EXPECT_EQ(left, (std::set<std::string>{".lock", "crowd", "drnode.info.lock", "node.db",
                                           "node.info"}));
}

TEST(CrowdChecks, NoticeASafetyThatIsSwitchedOff) {
    const std::pair<Lie, std::vector<std::size_t>> cases[] = {{Lie::kLock, {0, 1}},
                                                              {Lie::kRename, {kIdentity}}};
    for (const auto &[lie, found] : cases) {
        prepare();
        const auto areFound = [&found](const Board &board) {
            return std::all_of(found.begin(), found.end(),
                               [&](std::size_t which) { return board.of.at(which).faults > 0; });
        };
        const auto board = play(milliseconds(0), lie, [&](const Board &at) {
            OvraTest::soon([&] { return areFound(at); });
        });
        EXPECT_TRUE(areFound(*board)) << "lie " << int(lie);
    }
}
