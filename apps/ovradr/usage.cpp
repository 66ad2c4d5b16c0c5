// SPDX-License-Identifier: Apache-2.0
#include "usage.h"

#include "closest.h"
#include "help.h"

#include <ovrabase/address.h>
#include <ovrabase/number.h>

#include <algorithm>
#include <typeinfo>
#include <vector>

namespace Ovradr {

namespace {

using Options = std::vector<const CLI::Option *>;

std::string joined(const std::vector<std::string> &names, const std::string &before) {
    std::string text;
    for (std::size_t i = 0; i < names.size(); ++i) {
        text += (i == 0 ? "" : i + 1 < names.size() ? ", " : before) + names[i];
    }
    return text;
}

std::vector<std::string> commandsOf(const CLI::App &family) {
    std::vector<std::string> names;
    for (const CLI::App *child : family.get_subcommands([](const CLI::App *) { return true; })) {
        names.push_back(child->get_name());
    }
    return names;
}

std::string helpHint(const CLI::App &command) {
    return "`" + commandLine(command) + " --help` shows what it takes.";
}

Refusal refused(const CLI::App &command, const std::string &message) {
    return failure(ExitCode::kUsage, message, helpHint(command));
}

bool isOption(const std::string &argument) {
    return argument.size() > 1 && argument.front() == '-';
}

/// The name of an option, which a value may follow.
std::string optionName(const std::string &argument) {
    return argument.substr(0, argument.find('='));
}

/// The long options that are understood behind a command, without their dashes.
std::vector<std::string> longOptions(const CLI::App &command) {
    std::vector<std::string> names;
    for (const CLI::App *app = &command; app != nullptr; app = app->get_parent()) {
        for (const CLI::Option *option : app->get_options()) {
            names.insert(names.end(), option->get_lnames().begin(), option->get_lnames().end());
        }
    }
    return names;
}

Refusal unknownOption(const CLI::App &command, const std::string &name) {
    if (name == "--password") {
        return failure(ExitCode::kUsage, "A password is never an argument.",
                       "Use --password-file or --password-stdin, or have it asked for.");
    }
    const std::string word = OvraBase::toLower(name.substr(name.find_first_not_of('-')));
    const std::vector<std::string> names = longOptions(command);
    const auto begins = [&word](const std::string &each) { return each.starts_with(word); };
    const std::string meant = std::count_if(names.begin(), names.end(), begins) == 1
                                  ? *std::find_if(names.begin(), names.end(), begins)
                                  : closest(word, names);
    return failure(ExitCode::kUsage, "The command has no option " + name + ".",
                   (meant.empty() ? "" : "Did you mean --" + meant + "? ") + helpHint(command));
}

Refusal missingCommand(const CLI::App &family) {
    Refusal found = failure(ExitCode::kUsage, "A command is missing.",
                            "Write one of them behind `" + commandLine(family) + "`.");
    found.value().text = helpText(family) + "\n";
    return found;
}

Refusal missingArguments(const CLI::App &command) {
    std::vector<std::string> names;
    for (const CLI::Option *option : command.get_options()) {
        if (option->get_required() && option->count() == 0) {
            names.push_back(option->get_name(option->get_positional()));
        }
    }
    return refused(command,
                   joined(names, " and ") + (names.size() == 1 ? " is" : " are") + " missing.");
}

/// Of the options that were given, the first pair for which `others` says that it is wrong.
template <typename Others>
Refusal wrongPair(const CLI::App &command, Others others, bool together, const std::string &link,
                  const std::string &end) {
    for (const CLI::Option *option : command.get_options()) {
        for (const CLI::Option *other : others(*option)) {
            if (option->count() > 0 && (other->count() > 0) == together) {
                return refused(command, option->get_name() + link + other->get_name() + end);
            }
        }
    }
    return refused(command, "Its options do not go together.");
}

/// \param name  of the option, as the parser writes it
Refusal wrongCount(const CLI::App &command, const std::string &name) {
    const std::string option = name.starts_with("-") ? name : "--" + name;
    for (const CLI::App *app = &command; app != nullptr; app = app->get_parent()) {
        const CLI::Option *const known = app->get_option_no_throw(option);
        if (known != nullptr && known->get_items_expected_max() == 0) {
            return refused(command, option + " takes no value.");
        }
        if (known != nullptr && known->count() > 1) {
            return refused(command, option + " is given more than once.");
        }
    }
    return refused(command, option + " needs a value.");
}

/// What is wrong with what the parser understood.
Refusal wrongUse(const CLI::App &command, const CLI::ParseError &error) {
    static const std::string kConversion = "Could not convert: ";
    std::string text = error.what();
    text.erase(0, text.starts_with(kConversion) ? kConversion.size() : 0);
    const std::string name = text.substr(0, text.find_first_of(": "));
    if (typeid(error) == typeid(CLI::RequiredError)) {
        return missingArguments(command);
    }
    if (typeid(error) == typeid(CLI::ExcludesError)) {
        return wrongPair(
            command, [](const CLI::Option &option) { return option.get_excludes(); }, true, " and ",
            " do not go together.");
    }
    if (typeid(error) == typeid(CLI::RequiresError)) {
        return wrongPair(
            command, [](const CLI::Option &option) { return option.get_needs(); }, false,
            " is of use only with ", ".");
    }
    if (typeid(error) == typeid(CLI::ValidationError)) {
        return refused(command, text + ".");
    }
    return wrongCount(command, name);
}

} // namespace

const CLI::App *childOf(const CLI::App &family, const std::string &name) {
    const auto children = family.get_subcommands(
        [&name](const CLI::App *child) { return child->get_name() == name; });
    return children.empty() ? nullptr : children.front();
}

Refusal unknownCommand(const CLI::App &family, const std::string &word) {
    const std::vector<std::string> names = commandsOf(family);
    if (names.empty()) {
        return refused(family, "There are more arguments than the command takes.");
    }
    const std::string meant = closest(word, names);
    return failure(
        ExitCode::kUsage, "There is no command \"" + commandLine(family) + " " + word + "\".",
        (meant.empty() ? "" : "Did you mean `" + commandLine(family) + " " + meant + "`? ") +
            "There are: " + joined(names, ", ") + ".");
}

const CLI::App &reachedCommand(const CLI::App &app) {
    const CLI::App *last = &app;
    while (!last->get_subcommands().empty()) {
        last = last->get_subcommands().front();
    }
    return *last;
}

Refusal usageFailure(const CLI::App &app, const CLI::ParseError &error) {
    const CLI::App &command = reachedCommand(app);
    std::vector<std::string> surplus = app.remaining(true);
    std::erase(surplus, "--"); // the parser leaves it there
    const auto option = std::find_if(surplus.begin(), surplus.end(), isOption);
    const bool family = command.get_require_subcommand_min() > 0;
    if (family && !surplus.empty() && option != surplus.begin()) {
        return unknownCommand(command, surplus.front());
    }
    if (option != surplus.end()) {
        return unknownOption(command, optionName(*option));
    }
    if (!surplus.empty()) {
        return refused(command, "There are more arguments than the command takes.");
    }
    return family ? missingCommand(command) : wrongUse(command, error);
}

void trims(CLI::Option &option) {
    option.transform([](const std::string &text) { return OvraBase::trimmed(text); });
}

std::function<std::string(const std::string &)> wholeNumber(long least, long most) {
    return [least, most](const std::string &text) {
        return OvraBase::parseNumber(text, least, most)
                   ? std::string()
                   : "a whole number from " + std::to_string(least) + " to " +
                         std::to_string(most) + " is needed";
    };
}

} // namespace Ovradr
