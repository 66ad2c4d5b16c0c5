// SPDX-License-Identifier: Apache-2.0
// ovradr: the command line of an appliance. docs/ovradr.md describes it.
#include "access.h"
#include "command_tree.h"
#include "help.h"
#include "output.h"
#include "usage.h"

#include <ovrabase/file.h>
#include <ovradrcore/cache_folder.h>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <exception>
#include <string>
#include <string_view>
#include <vector>

namespace Ovradr {

namespace {

constexpr std::string_view kOneTimeCodeOption = "--otp";
constexpr std::string_view kPair = "pair";

/// Whether an argument of `pair` may be the code of an invitation, or a part of it.
bool isInviteCode(const std::string &argument) {
    return !argument.starts_with("-") && argument.find(':') == std::string::npos;
}

/// Copies the arguments and wipes a one-time code and the code of an invitation from where every
/// process can see them.
std::vector<std::string> takeArguments(int argc, char **argv) {
    std::vector<std::string> arguments;
    bool codeFollows = false;
    bool pairs = false;
    for (int i = 1; i < argc; ++i) {
        const std::string argument = argv[i];
        const bool codeInside = argument.starts_with(std::string(kOneTimeCodeOption) + "=");
        if (codeFollows || codeInside || (pairs && isInviteCode(argument))) {
            const std::size_t kept = codeInside ? kOneTimeCodeOption.size() + 1 : 0;
            std::memset(argv[i] + kept, '*', argument.size() - kept);
        }
        codeFollows = argument == kOneTimeCodeOption;
        pairs = pairs || argument == kPair;
        arguments.push_back(argument);
    }
    return arguments;
}

Outcome runChosen(const Command &chosen) {
    if (!isOwnUser()) {
        OvraDRCore::makeNoCacheFolder();
    }
    try {
        return chosen();
    } catch (const std::exception &error) {
        return failure(ExitCode::kFailed,
                       std::string("The command broke off: ") + error.what() + ".",
                       "The system log may say more.");
    }
}

int run(int argc, char **argv) {
    std::vector<std::string> arguments = takeArguments(argc, argv);
    // Also for a command line that cannot be parsed.
    bool json = std::find(arguments.begin(), arguments.end(), kJsonFlag) != arguments.end();
    CLI::App app("The command line of a replication node.", "ovradr");
    Command chosen;
    addCommandTree(app, json, chosen);
    try {
        std::reverse(arguments.begin(), arguments.end());
        app.parse(arguments);
    } catch (const CLI::CallForHelp &) {
        return static_cast<int>(tell(helpOf(reachedCommand(app)), json));
    } catch (const CLI::CallForVersion &) {
        return static_cast<int>(tell(versionReport(), json));
    } catch (const CLI::ParseError &error) {
        return static_cast<int>(tell(usageFailure(app, error), json));
    }
    return static_cast<int>(tell(runChosen(chosen), json));
}

} // namespace

} // namespace Ovradr

int main(int argc, char **argv) {
    OvraBase::fillStandardDescriptors();
    // A vanished reader shows as a failed write.
    std::signal(SIGPIPE, SIG_IGN);
    try {
        return Ovradr::run(argc, argv);
    } catch (const std::exception &error) {
        std::fprintf(stderr, "ovradr: %s\n", error.what());
        return static_cast<int>(Ovradr::ExitCode::kFailed);
    }
}
