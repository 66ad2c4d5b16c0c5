// SPDX-License-Identifier: Apache-2.0
#include "support/doc_page.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <stdexcept>

namespace OvraTest {

namespace {

std::string trimmed(const std::string &text) {
    const std::size_t first = text.find_first_not_of(' ');
    return first == std::string::npos ? std::string()
                                      : text.substr(first, text.find_last_not_of(' ') - first + 1);
}

std::string treeTop() {
    const char *const other = std::getenv("OVRA_PAGES");
    return other != nullptr ? other : OVRA_SOURCE_DIR;
}

DocPage::Row cellsOf(const std::string &line) {
    DocPage::Row cells;
    std::string cell;
    for (std::size_t i = 1; i < line.size(); ++i) {
        if (line[i] == '|' && line[i - 1] != '\\') {
            cells.push_back(trimmed(cell));
            cell.clear();
        } else {
            cell += line[i];
        }
    }
    return cells;
}

} // namespace

DocPage::DocPage(const std::string &path) {
    std::ifstream file(treeTop() + "/" + path);
    if (!file) {
        throw std::runtime_error(path + " cannot be read");
    }
    bool inBlock = false;
    sections_.emplace_back();
    for (std::string line; std::getline(file, line);) {
        inBlock = line.starts_with("```") ? !inBlock : inBlock;
        if (line.starts_with("#") && !inBlock) {
            sections_.push_back({trimmed(line.substr(line.find_first_not_of('#'))), ""});
        } else {
            sections_.back().text += line + "\n";
        }
    }
}

std::vector<DocPage::Row> DocPage::rows(const std::string &heading) const {
    std::vector<Row> rows;
    for (const Section &section : sections_) {
        std::istringstream text(section.heading == heading ? section.text : "");
        for (std::string line, last; std::getline(text, line); last = line) {
            if (line.starts_with("|---")) {
                rows.pop_back(); // the header
            } else if (line.starts_with("|")) {
                rows.push_back(cellsOf(line));
            }
        }
    }
    return rows;
}

std::vector<std::string> docPages() {
    std::vector<std::string> pages = {"README.md", "CONTRIBUTING.md", "SECURITY.md",
                                      "lab/README.md"};
    for (const auto &entry : std::filesystem::directory_iterator(treeTop() + "/docs")) {
        if (entry.path().extension() == ".md") {
            pages.push_back("docs/" + entry.path().filename().string());
        }
    }
    return pages;
}

std::vector<std::string> codeIn(const std::string &text) {
    static const std::regex kQuoted("`([^`]*)`");
    std::vector<std::string> code;
    std::istringstream lines(text);
    bool inBlock = false;
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with("```")) {
            inBlock = !inBlock;
        } else if (inBlock || line.starts_with("    ")) {
            code.push_back(trimmed(line));
        } else {
            for (std::sregex_iterator each(line.begin(), line.end(), kQuoted), end; each != end;
                 ++each) {
                code.push_back((*each)[1]);
            }
        }
    }
    return code;
}

} // namespace OvraTest
