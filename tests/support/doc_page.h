// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>
#include <vector>

namespace OvraTest {

/// A page of docs/, parsed for its facts. OVRA_PAGES overrides the source tree.
class DocPage {
public:
    struct Section {
        std::string heading; ///< without its signs; "" before the first one
        std::string text;    ///< up to the next heading of any level
    };
    using Row = std::vector<std::string>;

    /// \param path  from the top of the tree
    explicit DocPage(const std::string &path);

    const std::vector<Section> &sections() const { return sections_; }
    /// The rows of all tables in the sections with this heading, without their headers.
    std::vector<Row> rows(const std::string &heading) const;

private:
    std::vector<Section> sections_;
};

/// The pages that describe the current state, relative to the tree.
std::vector<std::string> docPages();

/// The text between backticks, and each line of code blocks.
std::vector<std::string> codeIn(const std::string &text);

} // namespace OvraTest
