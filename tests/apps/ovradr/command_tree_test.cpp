// SPDX-License-Identifier: Apache-2.0
#include "command_tree.h"
#include "support/doc_page.h"

#include <gtest/gtest.h>

#include <algorithm>
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
    bool known = true;   ///< false: a word stands in the place of a command that is none
};

Names optionsIn(const std::string &text) {
    static const std::regex kOption("--[a-z][a-z-]*");
    Names names;
    for (std::sregex_iterator found(text.begin(), text.end(), kOption), end; found != end;
         ++found) {
        names.insert(found->str());
    }
    return names;
}

/// The anchor of a heading.
std::string anchorOf(const std::string &heading) {
    std::string anchor = "#";
    for (const char c : heading) {
        if (std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '-' || c == '_') {
            anchor += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        } else if (c == ' ') {
            anchor += '-';
        }
    }
    return anchor;
}

class CommandTree : public testing::Test {
protected:
    CommandTree() {
        Ovradr::addCommandTree(app_, json_, chosen_);
        collect(app_, "");
    }

    /// std::nullopt if the code does not begin with the program's name.
    std::optional<Usage> usageIn(const std::string &code) {
        static const std::regex kUsage("^(?:[a-z0-9-]*[#$] )?ovradr( .*)?$");
        static const std::regex kWord("[a-z]+");
        std::smatch match;
        if (!std::regex_match(code, match, kUsage)) {
            return std::nullopt;
        }
        Usage usage;
        CLI::App *place = &app_;
        std::istringstream words(match[1]);
        for (std::string word; words >> word;) {
            const auto next = place->get_subcommands(
                [&word](const CLI::App *child) { return child->get_name() == word; });
            if (next.empty()) {
                usage.known = place->get_subcommands({}).empty() || !std::regex_match(word, kWord);
                std::getline(words, usage.rest);
                usage.rest = word + usage.rest;
                break;
            }
            place = next.front();
            usage.command += (usage.command.empty() ? "" : " ") + word;
        }
        return usage;
    }

    std::vector<Usage> usagesIn(const DocPage::Section &section) {
        std::vector<Usage> usages;
        for (const std::string &code : codeIn(section.heading + "\n" + section.text)) {
            if (const auto usage = usageIn(code)) {
                usages.push_back(*usage);
            }
        }
        return usages;
    }

    /// The options of a section that are in no usage line.
    Names looseOptionsIn(const DocPage::Section &section) {
        Names options;
        for (const std::string &code : codeIn(section.text)) {
            if (!usageIn(code)) {
                options.merge(optionsIn(code));
            }
        }
        return options;
    }

    /// The options and usage words that the page documents for the command.
    /// \return false if no section names the command
    bool readAbout(const std::string &command, const DocPage &page, Names &options,
                   std::string &usageText) {
        bool named = false;
        std::string links;
        for (const DocPage::Section &section : page.sections()) {
            for (const Usage &usage : usagesIn(section)) {
                if (usage.command == command) {
                    named = true;
                    usageText += usage.rest + " ";
                    options.merge(looseOptionsIn(section));
                    links += section.text;
                }
            }
        }
        for (const DocPage::Section &section : page.sections()) {
            if (links.find("(" + anchorOf(section.heading) + ")") != std::string::npos) {
                options.merge(looseOptionsIn(section));
            }
        }
        options.merge(optionsIn(usageText));
        return named;
    }

    bool has(const std::string &command, const std::string &option) const {
        return options_.at(command).count(option) > 0 || options_.at("").count(option) > 0;
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
    const DocPage page(kPage);
    for (const auto &[command, node] : commands_) {
        Names documented;
        std::string usage;
        if (!readAbout(command, page, documented, usage)) {
            ADD_FAILURE() << kPage << " does not describe `ovradr " << command << "`: add it";
            continue;
        }
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

TEST_F(CommandTree, IsAllThatPagesMention) {
    for (const std::string &name : OvraTest::docPages()) {
        const DocPage page(name);
        for (const DocPage::Section &section : page.sections()) {
            for (const Usage &usage : usagesIn(section)) {
                EXPECT_TRUE(usage.known) << name << ": there is no `ovradr " << usage.command << " "
                                         << usage.rest << "`";
                for (const std::string &option : optionsIn(usage.rest)) {
                    EXPECT_TRUE(has(usage.command, option))
                        << name << ": `ovradr " << usage.command << "` has no option " << option;
                }
            }
        }
    }
}

TEST_F(CommandTree, HasEveryOptionThatItsPageDescribes) {
    const DocPage page(kPage);
    for (const DocPage::Section &section : page.sections()) {
        Names commands;
        for (const Usage &usage : usagesIn(section)) {
            commands.insert(usage.command);
        }
        Names known = options_[""];
        for (const auto &[command, options] : options_) {
            if (commands.empty() || commands.count(command) > 0) {
                known.insert(options.begin(), options.end());
            }
        }
        for (const std::string &option : looseOptionsIn(section)) {
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
            EXPECT_TRUE(usage->known && commands_.count(usage->command) > 0)
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
