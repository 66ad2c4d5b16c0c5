// SPDX-License-Identifier: Apache-2.0
#include "help.h"

#include "output.h"
#include "usage.h"

#include <algorithm>
#include <memory>
#include <sstream>
#include <vector>

namespace Ovradr {

namespace {

constexpr std::size_t kWidth = 80;
constexpr std::size_t kIndent = 2;
constexpr std::size_t kMaxNames = 26; ///< names longer than that stand in a line of their own

struct Entry {
    std::string name;
    std::string text;
};

std::string section(const std::string &heading, const std::vector<Entry> &entries) {
    if (entries.empty()) {
        return "";
    }
    std::size_t names = 0;
    for (const Entry &entry : entries) {
        names = std::max(names, entry.name.size() <= kMaxNames ? entry.name.size() : 0);
    }
    const std::size_t column = kIndent + names + kIndent;
    std::string text = "\n" + heading + ":\n";
    for (const Entry &entry : entries) {
        const bool beside = entry.name.size() <= names;
        text += std::string(kIndent, ' ') + entry.name;
        text += beside ? std::string(column - kIndent - entry.name.size(), ' ')
                       : "\n" + std::string(column, ' ');
        text += wrapped(entry.text, kWidth, column).substr(column) + "\n";
    }
    return text;
}

/// "--account TEXT", "-h, --help", "URL".
std::string nameOf(const CLI::Option &option) {
    if (option.get_positional()) {
        return option.get_name(true);
    }
    std::string name;
    for (const std::string &letter : option.get_snames()) {
        name += "-" + letter + ", ";
    }
    for (const std::string &word : option.get_lnames()) {
        name += "--" + word;
    }
    return name + (option.get_items_expected_max() > 0 ? " " + option.get_type_name() : "");
}

std::vector<Entry> optionsOf(const CLI::App &command, bool positional) {
    std::vector<Entry> entries;
    for (const CLI::Option *option : command.get_options()) {
        if (option->get_positional() == positional) {
            entries.push_back({nameOf(*option), option->get_description()});
        }
    }
    return entries;
}

std::string usageOf(const CLI::App &command, bool hasCommands) {
    std::string text = "Usage: " + commandLine(command);
    for (const CLI::Option *option : command.get_options()) {
        if (option->get_required() && !option->get_positional()) {
            text += " " + nameOf(*option);
        }
    }
    text += " [OPTIONS]";
    for (const CLI::Option *option : command.get_options()) {
        if (option->get_positional()) {
            const std::string name =
                option->get_name(true) + (option->get_items_expected_max() > 1 ? "..." : "");
            text += option->get_required() ? " " + name : " [" + name + "]";
        }
    }
    return text + (hasCommands ? " COMMAND\n" : "\n");
}

/// Its lines; of those only examples, which are indented, stay as they are.
std::string footerOf(const CLI::App &command) {
    std::istringstream lines(command.get_footer());
    std::string text;
    for (std::string line; std::getline(lines, line);) {
        text += (line.starts_with(' ') ? line : wrapped(line, kWidth, 0)) + "\n";
    }
    return text;
}

class Help : public CLI::FormatterBase {
public:
    std::string make_help(const CLI::App *command, std::string /*name*/,
                          CLI::AppFormatMode /*mode*/) const override {
        return helpText(*command);
    }
};

} // namespace

std::string commandLine(const CLI::App &command) {
    const CLI::App *const parent = command.get_parent();
    return (parent == nullptr ? "" : commandLine(*parent) + " ") + command.get_name();
}

std::string helpText(const CLI::App &command) {
    std::vector<Entry> commands;
    for (const CLI::App *child : command.get_subcommands([](const CLI::App *) { return true; })) {
        commands.push_back({child->get_name(), child->get_description()});
    }
    // A family would have that of the program.
    const bool family = command.get_parent() != nullptr && !commands.empty();
    const std::string footer = family ? "" : footerOf(command);
    return wrapped(command.get_description(), kWidth, 0) + "\n\n" +
           usageOf(command, !commands.empty()) + section("Arguments", optionsOf(command, true)) +
           section("Options", optionsOf(command, false)) + section("Commands", commands) +
           (footer.empty() ? "" : "\n" + footer);
}

Report helpOf(const CLI::App &command) {
    Report report;
    report.text = helpText(command);
    report.data["command"] = commandLine(command);
    report.data["help"] = report.text;
    return report;
}

Report versionReport() {
    Report report;
    report.data["version"] = OVRADR_VERSION;
    report.text = "ovradr " OVRADR_VERSION "\n";
    return report;
}

void useHelp(CLI::App &app) {
    app.formatter(std::make_shared<Help>());
    app.set_help_flag("-h,--help", "Show this help");
}

void addHelpCommand(CLI::App &app, Command &chosen) {
    CLI::App *command = app.add_subcommand("help", "Show what there is, or what a command takes.");
    const auto words = std::make_shared<std::vector<std::string>>();
    command->add_option("COMMAND", *words, "The command, e.g. cred create");
    command->footer("The same is shown by --help behind a command.\n"
                    "Example:\n  ovradr help cred create");
    command->callback([&chosen, &app, words] {
        chosen = [&app, words]() -> Outcome {
            const CLI::App *found = &app;
            for (const std::string &word : *words) {
                const CLI::App *const next = childOf(*found, word);
                if (next == nullptr) {
                    return unknownCommand(*found, word);
                }
                found = next;
            }
            return helpOf(*found);
        };
    });
}

} // namespace Ovradr
