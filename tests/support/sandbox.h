// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <sys/stat.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

namespace OvraTest {

/// The exit code of a program that refuses to run here.
inline constexpr int kNotHere = 2;

/// Whether the fixed paths of the library are private to this program. The variable alone does not
/// prove that, as it may have leaked into a shell; the folder exists only in a sandbox, where
/// lab/lib/view.sh creates it.
inline bool isSandbox() {
    const char *const said = std::getenv("OVRADR_SANDBOX");
    struct stat mark {};
    return said != nullptr && std::strcmp(said, "yes") == 0 &&
           lstat("/run/host/ovradr-sandbox", &mark) == 0 && S_ISDIR(mark.st_mode);
}

/// Prints why a program does not run outside a sandbox, and how to run it inside.
inline void explainSandbox(int argc, const char *const *argv) {
    std::string command;
    for (int i = 0; i < argc; ++i) {
        command += std::string(" ") + argv[i];
    }
    std::fprintf(
        stderr,
        "%s writes to the library's fixed paths (/usr/ovra, /tmp/.ovradrcache, /run/lock), "
        "and here they are\nthe machine's own: its identity, database and accounts would be "
        "lost. Nothing was run. Give it a node of its own:\n"
        "  %s%s\n"
        "or, in a debugger:\n"
        "  %s gdb --args%s\n",
        argv[0], OVRA_SANDBOX, command.c_str(), OVRA_SANDBOX, command.c_str());
}

} // namespace OvraTest
