// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"

#include <ovracore/ovracore.h>

#include <fcntl.h>

#include <array>
#include <csignal>
#include <cstdio>
#include <string>
#include <thread>
#include <vector>

using OvraTest::readFile;
using OvraTest::writeFile;

namespace {

std::string readAll(FILE *stream) {
    std::string text;
    std::array<char, 4096> block{};
    std::size_t count = 0;
    while ((count = fread(block.data(), 1, block.size(), stream)) > 0) {
        text.append(block.data(), count);
    }
    return text;
}

std::string outputOf(const char *program, const char *argument) {
    FILE *const stream = OLIBCPopen(program, "r", argument, nullptr);
    std::string text = stream != nullptr ? readAll(stream) : "not started";
    OLIBCPclose(stream);
    return text;
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

TEST_F(Program, GetsItsArgumentsAsTheyAreAndGivesItsOutputAndStatus) {
    const std::string program = script("#!/bin/sh\nprintf '<%s>' \"$@\"\nexit 3\n");
    FILE *const stream = OLIBCPopen(program.c_str(), "r", "a b", "", "$HOME;`id`", "*", nullptr);
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(readAll(stream), "<a b><><$HOME;`id`><*>");
    const int status = OLIBCPclose(stream);
    EXPECT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 3);
}

TEST_F(Program, CanBeWrittenTo) {
    const std::string program = script("#!/bin/sh\ncat >\"$1\"\n");
    FILE *const stream = OLIBCPopen(program.c_str(), "w", path("out").c_str(), nullptr);
    ASSERT_NE(stream, nullptr);
    std::fputs("to the program", stream);
    EXPECT_EQ(OLIBCPclose(stream), 0);
    EXPECT_EQ(readFile(path("out")), "to the program");
}

TEST_F(Program, ThatCannotBeStartedGivesNoStream) {
    EXPECT_EQ(OLIBCPopen(path("absent").c_str(), "r", nullptr), nullptr);
    EXPECT_EQ(OLIBCPopen(script("#!/bin/sh\n", 0600).c_str(), "r", nullptr), nullptr);
    EXPECT_EQ(OLIBCPopen(script("#!/no/such/shell\n").c_str(), "r", nullptr), nullptr);
    EXPECT_EQ(OLIBCPopen(script("no program at all").c_str(), "r", nullptr), nullptr);
    EXPECT_EQ(OLIBCPopen(path("").c_str(), "r", nullptr), nullptr);
    EXPECT_EQ(OLIBCPopen("/bin/true", "rw", nullptr), nullptr);
    EXPECT_EQ(OLIBCPopen(nullptr, "r", nullptr), nullptr);
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
    const std::string descriptors = outputOf("/bin/ls", "/proc/self/fd");
    const std::string input = outputOf("/bin/readlink", "/proc/self/fd/0");
    const std::string status = outputOf("/bin/cat", "/proc/self/status");
    OLIBCPclose(outer);
    close(leaky);
    EXPECT_EQ(descriptors, "0\n1\n2\n3\n"); // 3 is how ls reads the folder
    EXPECT_TRUE(input.ends_with("/dev/null\n")) << input;
    EXPECT_EQ(signalsIn(status, "SigBlk:"), 0U);
    EXPECT_EQ(signalsIn(status, "SigIgn:"), 0U);
}

TEST_F(Program, ManyRunAtOnceEachWithItsOwnStatus) {
    const std::string program = script("#!/bin/sh\necho \"$1\"\nexit \"$1\"\n");
    std::vector<std::thread> threads;
    threads.reserve(8);
    std::array<std::string, 8> wrong;
    for (int thread = 0; thread < 8; ++thread) {
        threads.emplace_back([&, thread] {
            const std::string number = std::to_string(thread + 1);
            for (int round = 0; round < 10; ++round) {
                FILE *const stream = OLIBCPopen(program.c_str(), "r", number.c_str(), nullptr);
                const std::string output = stream != nullptr ? readAll(stream) : "no stream";
                const int status = OLIBCPclose(stream);
                if (output != number + "\n" || WEXITSTATUS(status) != thread + 1) {
                    wrong[static_cast<std::size_t>(thread)] = output;
                }
            }
        });
    }
    for (std::thread &thread : threads) {
        thread.join();
    }
    for (const std::string &output : wrong) {
        EXPECT_EQ(output, "");
    }
}

TEST_F(Program, OnlyItsOwnStreamsAreClosed) {
    FILE *const file = std::fopen("/dev/null", "r");
    EXPECT_EQ(OLIBCPclose(file), -1);
    EXPECT_EQ(std::fclose(file), 0);
    EXPECT_EQ(OLIBCPclose(nullptr), -1);
}

} // namespace
