// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"

#include <ovracore/ovracore.h>

#include <fcntl.h>

#include <array>
#include <atomic>
#include <csignal>
#include <cstdio>
#include <string>
#include <thread>
#include <utility>
#include <vector>

using OvraTest::writeFile;

namespace {

/// Its output and status.
std::pair<std::string, int> finish(FILE *stream) {
    std::string text = stream != nullptr ? "" : "not started";
    std::array<char, 4096> block{};
    std::size_t count = 0;
    while (stream != nullptr && (count = fread(block.data(), 1, block.size(), stream)) > 0) {
        text.append(block.data(), count);
    }
    return {text, OLIBCPclose(stream)};
}

std::pair<std::string, int> run(const std::string &program, const std::string &argument) {
    return finish(OLIBCPopen(program.c_str(), "r", argument.c_str(), nullptr));
}

/// The standard signals in a mask of proc(5); those from 32 on are the C library's own.
unsigned long signalsIn(const std::string &status, const std::string &mask) {
    return std::stoul(status.substr(status.find(mask) + mask.size()), nullptr, 16) & 0x7FFFFFFFU;
}

struct Program : OvraTest::OwnFiles {
    std::string script(const std::string &body, mode_t mode = 0700) const {
        writeFile(path("script"), body);
        chmod(path("script").c_str(), mode);
        return path("script");
    }
};

TEST_F(Program, GetsItsArgumentsAndInputAsTheyAreAndGivesItsOutputAndStatus) {
    std::string program = script("#!/bin/sh\nprintf '<%s>' \"$@\"\nexit 3\n");
    const auto [output, status] =
        finish(OLIBCPopen(program.c_str(), "r", "a b", "", "$HOME;`id`", "*", nullptr));
    EXPECT_EQ(output, "<a b><><$HOME;`id`><*>");
    EXPECT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 3);
    program = script("#!/bin/sh\ncat >\"$1\"\n");
    FILE *const stream = OLIBCPopen(program.c_str(), "w", path("out").c_str(), nullptr);
    ASSERT_NE(stream, nullptr);
    std::fputs("to the program", stream);
    EXPECT_EQ(OLIBCPclose(stream), 0);
    EXPECT_EQ(OvraTest::readFile(path("out")), "to the program");
}

TEST_F(Program, ThatCannotBeStartedGivesNoStreamAndOnlyItsOwnAreClosed) {
    for (const auto &[body, mode] : {std::pair{"#!/bin/sh\n", 0600U},
                                     {"#!/no/such/shell\n", 0700U},
                                     {"no program at all", 0700U}}) {
        EXPECT_EQ(OLIBCPopen(script(body, mode).c_str(), "r", nullptr), nullptr) << body;
    }
    EXPECT_EQ(OLIBCPopen(path("absent").c_str(), "r", nullptr), nullptr);
    EXPECT_EQ(OLIBCPopen(path("").c_str(), "r", nullptr), nullptr);
    EXPECT_EQ(OLIBCPopen("/bin/true", "rw", nullptr), nullptr);
    EXPECT_EQ(OLIBCPopen(nullptr, "r", nullptr), nullptr);
    FILE *const file = std::fopen("/dev/null", "r");
    EXPECT_EQ(OLIBCPclose(file), -1);
    EXPECT_EQ(std::fclose(file), 0);
    EXPECT_EQ(OLIBCPclose(nullptr), -1);
}

TEST_F(Program, InheritsNeitherDescriptorsNorSignalSettings) {
    const int leaky = open("/dev/null", O_RDONLY); // deliberately without O_CLOEXEC
    ASSERT_GE(leaky, 0);
    sigset_t blocked;
    sigemptyset(&blocked);
    sigaddset(&blocked, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &blocked, nullptr);
    std::signal(SIGPIPE, SIG_IGN);
    FILE *const outer = OLIBCPopen("/bin/cat", "w", nullptr); // another open pipe
    const std::string descriptors = run("/bin/ls", "/proc/self/fd").first;
    const std::string input = run("/bin/readlink", "/proc/self/fd/0").first;
    const std::string status = run("/bin/cat", "/proc/self/status").first;
    OLIBCPclose(outer);
    close(leaky);
    EXPECT_EQ(descriptors, "0\n1\n2\n3\n"); // 3 is how ls reads the folder
    EXPECT_TRUE(input.ends_with("/dev/null\n")) << input;
    EXPECT_EQ(signalsIn(status, "SigBlk:"), 0U);
    EXPECT_EQ(signalsIn(status, "SigIgn:"), 0U);
}

TEST_F(Program, ManyRunAtOnceEachWithItsOwnStatus) {
    const std::string program = script("#!/bin/sh\necho \"$1\"\nexit \"$1\"\n");
    std::atomic<int> right = 0;
    std::vector<std::jthread> threads;
    for (int number = 1; number <= 8; ++number) {
        threads.emplace_back([&, number] {
            for (int round = 0; round < 10; ++round) {
                const auto [output, status] = run(program, std::to_string(number));
                right += output == std::to_string(number) + "\n" && WEXITSTATUS(status) == number;
            }
        });
    }
    threads.clear();
    EXPECT_EQ(right, 80);
}

} // namespace
