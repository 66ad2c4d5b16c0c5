// SPDX-License-Identifier: Apache-2.0
#include "support/local_node.h"
#include "support/misbehaving_server.h"
#include "support/other_process.h"

#include <ovracore/ovracore.h>
#include <ovradrcore/cache.h>
#include <ovradrcore/log.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/peer_trust.h>
#include <ovraplatform/session_store.h>

#include <gtest/gtest.h>
#include <sys/mman.h>

#include <atomic>
#include <iterator>
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

/// Memory that child processes share with this one.
std::atomic<int> &shared() {
    static auto *const number = new (mmap(nullptr, sizeof(std::atomic<int>), PROT_READ | PROT_WRITE,
                                          MAP_SHARED | MAP_ANONYMOUS, -1, 0)) std::atomic<int>(0);
    return *number;
}

} // namespace

TEST(Fork, AChildOfAProcessWithThreadsAtWorkDoesWhatItsParentCan) {
    provisionNode();
    std::atomic<int> &step = shared();
    const OtherProcess remote([&step] {
        const MisbehavingServer server({.tls = true});
        OvraPlatform::trustEndpoint("https", "127.0.0.1", server.port(), server.fingerprint());
        step = server.port();
        return pause();
    });
    while ((port = step) == 0) {
        std::this_thread::sleep_for(1ms);
    }
    addCred("node_cred", "n1", "c1", "https", port, "s1");
    addCred("node_cred", "n2", "c2", "https", port, "s2");
    std::atomic<bool> stop{false};
    std::vector<std::thread> threads;
    for (const auto &each : kSteps) {
        threads.emplace_back([&] {
            while (!stop) {
                EXPECT_TRUE(each.run()) << each.name;
            }
        });
    }
    for (int round = 0; round < 40 && !HasFailure(); ++round) {
        step = 0;
        OtherProcess child([&step] {
            while (step < std::ssize(kSteps) && kSteps[step].run()) {
                ++step;
            }
            return step < std::ssize(kSteps) ? 1 : 0;
        });
        EXPECT_EQ(child.wait(), 0)
            << "in round " << round << ": " << kSteps[step % std::ssize(kSteps)].name;
    }
    stop = true;
    for (std::thread &thread : threads) {
        thread.join();
    }
}
