// SPDX-License-Identifier: Apache-2.0
#include <ovrabase/connect.h>

#include <gtest/gtest.h>
#include <sys/resource.h>

#include <cerrno>
#include <fstream>

using namespace OvraBase;
using namespace std::chrono_literals;

namespace {

Deadline in(std::chrono::milliseconds time) {
    return std::chrono::steady_clock::now() + time;
}

/// A port of a loopback address that accepts connections until its queue is full, then is silent.
struct Listener {
    Listener(const char *host, bool full)
        : address(*parseAddress(host, 0)) {
        EXPECT_EQ(bind(fd.get(), address.get(), address.size), 0);
        getsockname(fd.get(), reinterpret_cast<sockaddr *>(&address.storage), &address.size);
        EXPECT_EQ(listen(fd.get(), full ? 0 : 8), 0);
        if (full) {
            EXPECT_EQ(connect(first.get(), address.get(), address.size), 0);
        }
    }
    SocketAddress address;
    UniqueFd fd{socket(address.storage.ss_family, SOCK_STREAM, 0)};
    UniqueFd first{socket(address.storage.ss_family, SOCK_STREAM, 0)};
};

int errorOf(const std::vector<SocketAddress> &addresses, std::chrono::milliseconds time) {
    const auto connected = connectFirst(addresses, in(time));
    return connected ? 0 : connected.error().number;
}

} // namespace

TEST(Connect, ReachesTheOneAddressThatAnswersBesideThoseThatDoNot) {
    const Listener silent("127.0.0.1", true);
    const Listener silentToo("::1", true);
    const Listener living("127.0.0.2", false);
    const SocketAddress refusing = *parseAddress("127.0.0.3", 1);
    const auto start = std::chrono::steady_clock::now();
    const auto connected = connectFirst({silent.address, silent.address, silentToo.address,
                                         silent.address, refusing, living.address},
                                        in(60s));
    ASSERT_TRUE(connected);
    EXPECT_EQ(addressText(connected->peer.get()), "127.0.0.2");
    EXPECT_LT(std::chrono::steady_clock::now() - start, 30s);
    EXPECT_EQ(errorOf({silent.address, refusing}, 300ms), ETIMEDOUT);
    EXPECT_EQ(errorOf({refusing, refusing}, 60s), ECONNREFUSED);
    EXPECT_EQ(errorOf({}, 60s), ENETUNREACH);
}

TEST(Connect, TellsAShortageFromAHostThatIsNotThere) {
    EXPECT_EQ(resolveHost("no-such-host.invalid", 1, in(60s)).error().number, 0);
    EXPECT_EQ(resolveHost("127.0.0.1", 1, in(0s)).value().size(), 1U);
    const Listener living("127.0.0.1", false);
    rlimit limit{};
    getrlimit(RLIMIT_NOFILE, &limit);
    const rlimit none{0, limit.rlim_max};
    setrlimit(RLIMIT_NOFILE, &none);
    EXPECT_EQ(errorOf({living.address, living.address}, 60s), EMFILE);
    EXPECT_EQ(resolveHost("no-such-host.invalid", 1, in(60s)).error().number, EMFILE);
    setrlimit(RLIMIT_NOFILE, &limit);
    EXPECT_EQ(errorOf({living.address}, 60s), 0);
}

TEST(Connect, TellsAShortageOfLocalPortsFromAFamilyWithoutAnAddress) {
    constexpr char kPorts[] = "/proc/sys/net/ipv4/ip_local_port_range";
    const Listener living("127.0.0.1", false);
    const SocketAddress ipv6 = *parseAddress("2001:db8::1", 1);
    std::ofstream("/proc/sys/net/ipv6/conf/lo/disable_ipv6") << "1";
    EXPECT_EQ(errorOf({ipv6}, 60s), ENETUNREACH);
    if (!(std::ofstream(kPorts) << "1024 1025" << std::flush)) {
        GTEST_SKIP() << "the ports of this sandbox cannot be limited";
    }
    const auto first = connectFirst({living.address}, in(60s));
    const auto second = connectFirst({living.address}, in(60s));
    const int error = errorOf({living.address, ipv6}, 60s);
    EXPECT_EQ(error, EADDRNOTAVAIL);
    EXPECT_TRUE(isShortage(error) && !isShortage(ENETUNREACH));
}
