// SPDX-License-Identifier: Apache-2.0
#include "command_tree.h"
#include "output.h"
#include "support/doc_page.h"

#include <gtest/gtest.h>

#include <cctype>
#include <map>
#include <optional>
#include <regex>
#include <set>
#include <sstream>

namespace {

using OvraTest::codeIn;
using OvraTest::DocPage;
using Names = std::set<std::string>;

constexpr char kPage[] = "docs/ovradr.md";

/// The statement of a code span in a page about the program.
struct Usage {
    std::string command; ///< "cred create"; "" for the program itself
    std::string rest;    ///< what follows the command
};

/// What stands between the backticks of a section.
struct Content {
    std::vector<Usage> usages;
    Names looseOptions; ///< those in no usage
};

/// What the page says about a command.
struct Description {
    Names options;
    std::string usage;
};

Names optionsIn(const std::string &text) {
    static const std::regex kOption("--[a-z][a-z-]*");
    return {std::sregex_token_iterator(text.begin(), text.end(), kOption), {}};
}

/// The target of a link to a heading.
std::string linkTo(const std::string &heading) {
    std::string anchor = std::regex_replace(heading, std::regex("[^A-Za-z0-9_ -]"), "");
    for (char &c : anchor) {
        c = c == ' ' ? '-' : static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    }
    return "(#" + anchor + ")";
}

class CommandTree : public testing::Test {
protected:
    CommandTree() {
        Ovradr::addCommandTree(app_, json_, chosen_);
        collect(app_, "");
    }

    /// std::nullopt if the code does not begin with the program's name.
    std::optional<Usage> usageIn(const std::string &code) const {
        static const std::regex kUsage("(?:[a-z0-9-]*[#$] )?ovradr( .*)?");
        static const std::regex kNext(" *([^ ]+)(.*)");
        std::smatch match;
        if (!std::regex_match(code, match, kUsage)) {
            return std::nullopt;
        }
        Usage usage{"", match[1]};
        for (std::smatch next; std::regex_match(usage.rest, next, kNext); usage.rest = next[2]) {
            const std::string longer =
                usage.command + (usage.command.empty() ? "" : " ") + next[1].str();
            if (options_.count(longer) == 0) {
                break;
            }
            usage.command = longer;
        }
        return usage;
    }

    Content contentOf(const DocPage::Section &section) const {
        Content content;
        for (const std::string &code : codeIn(section.heading + "\n" + section.text)) {
            if (const auto usage = usageIn(code)) {
                content.usages.push_back(*usage);
            } else {
                content.looseOptions.merge(optionsIn(code));
            }
        }
        return content;
    }

    /// By command: what stands in the sections that name it, and in those that they link to.
    std::map<std::string, Description> descriptionsIn(const DocPage &page) const {
        std::map<std::string, Description> descriptions;
        for (const DocPage::Section &section : page.sections()) {
            for (const auto &[command, rest] : contentOf(section).usages) {
                Description &description = descriptions[command];
                description.usage += rest + " ";
                description.options.merge(optionsIn(rest));
                for (const DocPage::Section &other : page.sections()) {
                    if (other.heading == section.heading ||
                        section.text.find(linkTo(other.heading)) != std::string::npos) {
                        description.options.merge(contentOf(other).looseOptions);
                    }
                }
            }
        }
        return descriptions;
    }

    bool isCommand(const std::string &words) const {
        return !words.empty() && commands_.count(words) > 0;
    }

    std::map<std::string, CLI::App *> commands_; ///< those that do something, and the program
    std::map<std::string, Names> options_;       ///< of each, and of the families

private:
    void collect(CLI::App &node, const std::string &path) {
        for (const CLI::Option *option : node.get_options()) {
            for (const std::string &name : option->get_lnames()) {
                options_[path].insert("--" + name);
            }
        }
        for (CLI::App *child : node.get_subcommands({})) {
            collect(*child, path + (path.empty() ? "" : " ") + child->get_name());
        }
        if (path.empty() || node.get_subcommands({}).empty()) {
            commands_[path] = &node;
        }
    }

    CLI::App app_{"", "ovradr"};
    bool json_ = false;
    Ovradr::Command chosen_;
};

TEST_F(CommandTree, IsDocumentedAsAWhole) {
    auto descriptions = descriptionsIn(DocPage(kPage));
    for (const auto &[command, node] : commands_) {
        EXPECT_TRUE(descriptions.count(command) > 0)
            << kPage << " does not describe `ovradr " << command << "`: add it";
        const auto &[documented, usage] = descriptions[command];
        for (const std::string &option : options_[command]) {
            EXPECT_TRUE(documented.count(option) > 0 || (option == "--help" && !command.empty()))
                << kPage << ": `ovradr " << command << "` has an option " << option
                << ": name it in the section of the command, or link to the section that does";
        }
        for (const CLI::Option *option : node->get_options()) {
            EXPECT_TRUE(!option->get_positional() ||
                        usage.find(option->get_name()) != std::string::npos)
                << kPage << ": `ovradr " << command << "` takes " << option->get_name()
                << ": add it to its usage";
        }
    }
}

TEST_F(CommandTree, ShowsAnExampleOfEveryCommand) {
    for (const auto &[command, node] : commands_) {
        EXPECT_NE(node->get_footer().find("ovradr " + command), std::string::npos)
            << "--help of `ovradr " << command << "` has no example: add one to its footer";
    }
}

TEST_F(CommandTree, HasHelpOfEightyColumns) {
    for (const auto &[command, node] : commands_) {
        for (const CLI::App *app : {node, node->get_parent()}) {
            std::istringstream lines(app == nullptr ? "" : app->help());
            for (std::string line; std::getline(lines, line);) {
                EXPECT_LE(Ovradr::displayWidth(line), 80U) << command << ": " << line;
            }
        }
    }
}

TEST_F(CommandTree, IsAllThatPagesMention) {
    static const std::regex kWordFirst(" *[a-z]+( .*)?");
    for (const std::string &name : OvraTest::docPages()) {
        const DocPage page(name);
        for (const DocPage::Section &section : page.sections()) {
            for (const auto &[command, rest] : contentOf(section).usages) {
                EXPECT_TRUE(isCommand(command) || !std::regex_match(rest, kWordFirst))
                    << name << ": there is no `ovradr " << command << rest << "`";
                for (const std::string &option : optionsIn(rest)) {
                    EXPECT_TRUE(options_[command].count(option) + options_[""].count(option) > 0)
                        << name << ": `ovradr " << command << "` has no option " << option;
                }
            }
        }
    }
}

TEST_F(CommandTree, HasEveryOptionThatItsPageDescribes) {
    const DocPage page(kPage);
    Names all;
    for (const auto &[command, options] : options_) {
        all.insert(options.begin(), options.end());
    }
    for (const DocPage::Section &section : page.sections()) {
        const auto [usages, looseOptions] = contentOf(section);
        Names known = usages.empty() ? all : options_[""];
        for (const Usage &usage : usages) {
            known.merge(Names(options_[usage.command]));
        }
        for (const std::string &option : looseOptions) {
            EXPECT_TRUE(known.count(option) > 0)
                << kPage << ", \"" << section.heading
                << "\": no command of this section has an option " << option;
        }
    }
}

TEST_F(CommandTree, HasItsDocumentsForScriptsDescribed) {
    Names described;
    for (const DocPage::Row &row : DocPage(kPage).rows("For scripts")) {
        for (const std::string &code : codeIn(row[0])) {
            const std::optional<Usage> usage = usageIn("ovradr " + code);
            EXPECT_TRUE(isCommand(usage->command))
                << kPage << ", \"For scripts\": there is no command " << code;
            described.insert(usage->command);
        }
    }
    for (const auto &[command, node] : commands_) {
        EXPECT_TRUE(command.empty() || described.count(command) > 0)
            << kPage << ", \"For scripts\": add a row with the `data` of `" << command << "`";
    }
}

} // namespace
