// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "support/local_node.h"
#include "support/misbehaving_server.h"

#include <ovracore/ovracore.h>
#include <ovradrcore/cache.h>
#include <ovradrcore/file_lock.h>
#include <ovradrcore/log.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/session_store.h>

#include <sys/file.h>
#include <sys/mman.h>

#include <atomic>
#include <chrono>
#include <thread>
#include <vector>

using namespace OvraDRNode;
using namespace OvraTest;
using namespace std::chrono_literals;

namespace {

int port = 0; // of the remote node

struct Fact : OvraDRCore::Cache {
    Fact()
        : Cache("/tmp/.ovradrcache/fact", "fact", 0, true, 3) {}
    Json::Value GetInfo() const override { return {}; }
    bool GetUpdatedData(Json::Value &value) const override {
        value = true;
        return true;
    }
    bool IsValid(const Json::Value &value) const override { return value.isBool(); }
};

/// What threads do while their process forks, and what each child then does.
const struct {
    const char *name;
    bool (*run)();
} kSteps[] = {
    {"log",
     [] {
         OVRA_DEBUG("a line");
         return true;
     }},
    {"read the node database",
     [] {
         DRNode node;
         return DRNodeDB::Get("n1", node);
     }},
    {"write the node database",
     [] { return DRNodeDB::SetConn("c2", Conn::https("127.0.0.1", port)); }},
    {"cache", [] { return Fact().UpdateWithData(true) && Fact().Read() == true; }},
    {"identity", [] { return !DRNode::getLocalNodeId().empty(); }},
    {"settings", [] { return OLIBCFileSetKeyValue("/usr/ovra/x", "k", "v", "%s=\"%s\"\n") >= 0; }},
    {"sessions",
     [] {
         OvraPlatform::SessionStore store;
         const auto id = store.create({.user = "u", .app = "a", .keepOthers = true});
         return id && store.find(*id) && store.remove(*id);
     }},
    {"probe", [] { return BaseSender::IsConnectable(Conn::https("127.0.0.1", port)); }},
    {"send",
     [] {
         return NodeSender("n1").process({"OVRA.Test", 1, "get", Json::objectValue}).isSuccess();
     }},
    {"program", [] { return OLIBCPclose(OLIBCPopen("/bin/true", "r", nullptr)) == 0; }},
};

/// A process with its own fate; what it shares with this one is where it stands.
struct Child {
    std::atomic<int> *step;
    pid_t pid;

    template <typename Work>
    explicit Child(Work work)
        : step(new (mmap(nullptr, sizeof(*step), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS,
                         -1, 0)) std::atomic<int>(-1))
        , pid(fork()) {
        if (pid == 0) {
            _exit(work(*step));
        }
    }
    Child(const Child &) = delete;
    Child &operator=(const Child &) = delete;
    ~Child() {
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
        munmap(step, sizeof(*step));
    }
    /// Its exit status; -1 if it does not end.
    int status() const {
        int found = 0;
        const auto end = std::chrono::steady_clock::now() + 30s;
        while (waitpid(pid, &found, WNOHANG) == 0) {
            if (std::chrono::steady_clock::now() > end) {
                return -1;
            }
            std::this_thread::sleep_for(1ms);
        }
        return found;
    }
};

} // namespace

TEST(Fork, AChildOfAProcessWithThreadsAtWorkDoesWhatItsParentCan) {
    provisionNode();
    const Child remote([](std::atomic<int> &shared) {
        MisbehavingServer server({.tls = true});
        shared = server.port();
        pause();
        return 0;
    });
    while ((port = *remote.step) < 0) {
        std::this_thread::sleep_for(1ms);
    }
    addCred("node_cred", "n1", "c1", "https", port, "s1");
    addCred("node_cred", "n2", "c2", "https", port, "s2");
    std::atomic<bool> stop{false};
    std::vector<std::thread> threads;
    for (const auto &step : kSteps) {
        threads.emplace_back([&] {
            while (!stop) {
                EXPECT_TRUE(step.run()) << step.name;
            }
        });
    }
    for (int round = 0; round < 40 && !HasFailure(); ++round) {
        const Child child([](std::atomic<int> &where) {
            for (const auto &step : kSteps) {
                ++where;
                if (!step.run()) {
                    return 1;
                }
            }
            return 0;
        });
        EXPECT_EQ(child.status(), 0) << "in round " << round << ": " << kSteps[*child.step].name;
    }
    stop = true;
    for (std::thread &thread : threads) {
        thread.join();
    }
}
