// SPDX-License-Identifier: Apache-2.0
#include "command_tree.h"

#include "help.h"
#include "output.h"

#include <string>

namespace Ovradr {

void addCommandTree(CLI::App &app, bool &json, Command &chosen) {
    app.fallthrough();
    useHelp(app);
    app.require_subcommand(1);
    app.set_version_flag("--version", OVRADR_VERSION, "Show the version of the program");
    app.add_flag(std::string(kJsonFlag), json,
                 "One JSON document on standard output, also for an error");
    app.add_flag_callback("--wide", useWideOutput,
                          "Whole ids and times, and no line broken to fit the terminal");
    app.footer("Exit codes: 0 ok, 1 failed, 2 usage, 3 not reachable, 4 log-in refused,\n"
               "  5 one-time code, 6 key not trusted, 7 not found, 8 not permitted,\n"
               "  9 not set up; of doctor also 10 name unknown, 11 no appliance,\n"
               "  12 wrong node, 13 clocks\n"
               "Examples:\n"
               "  ovradr setup\n"
               "  ovradr invite\n"
               "  ovradr pair 22TQ8-...\n"
               "  ovradr call 3f2a OVRA.DR.Node info");
    addHelpCommand(app, chosen);
    addSetupCommand(app, chosen);
    addStatusCommand(app, chosen);
    addNodeCommands(app, chosen);
    addUserCommands(app, chosen);
    addInviteCommand(app, chosen);
    addPairCommand(app, chosen);
    addCredCommands(app, chosen);
    addSessionCommands(app, chosen);
    addCallCommand(app, chosen);
    addConnCommands(app, chosen);
    addAttrCommands(app, chosen);
    addWhyCommand(app, chosen);
    addDoctorCommand(app, chosen);
    addSpeedCommand(app, chosen);
    addFarlinkCommands(app, chosen);
    // The examples of the whole are none of a family's.
    for (CLI::App *family : app.get_subcommands([](const CLI::App *) { return true; })) {
        if (family->get_footer() == app.get_footer()) {
            family->footer("");
        }
    }
}

} // namespace Ovradr
