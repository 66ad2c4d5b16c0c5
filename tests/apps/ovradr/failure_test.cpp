// SPDX-License-Identifier: Apache-2.0
#include "failure.h"
#include "support/doc_page.h"

#include <gtest/gtest.h>

#include <map>

namespace Ovradr {

namespace {

constexpr int kMaxCode = 999;

/// The meaning of a code, as a row of the table.
std::string rowOf(const Failure &failure) {
    return "| " + std::to_string(failure.code) + " | `" + failure.name + "` | " +
           std::to_string(static_cast<int>(failure.exit)) + " | " + failure.message + " |";
}

TEST(Failure, IsDocumentedWithWhatItsCodeMeans) {
    std::map<std::string, std::string> rows;
    for (const auto &row : OvraTest::DocPage("docs/ovradr.md").rows("Error codes")) {
        std::string &text = rows[row[0]];
        EXPECT_EQ(text, "") << "docs/ovradr.md, \"Error codes\" has two rows for " << row[0];
        for (const std::string &cell : row) {
            text += "| " + cell + " ";
        }
        text += "|";
    }
    for (int code = 1; code <= kMaxCode; ++code) {
        const std::string number = std::to_string(code);
        const Failure failure = failureOf(code).value();
        if (failure.name != "error_" + number) {
            EXPECT_EQ(rows[number], rowOf(failure))
                << "docs/ovradr.md, \"Error codes\" has to have the row\n"
                << rowOf(failure);
            rows.erase(number);
        }
    }
    for (const auto &[code, row] : rows) {
        ADD_FAILURE() << "docs/ovradr.md, \"Error codes\": failure.cpp has no text for " << row;
    }
}

} // namespace

} // namespace Ovradr
