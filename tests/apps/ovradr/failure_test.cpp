// SPDX-License-Identifier: Apache-2.0
#include "failure.h"
#include "support/doc_page.h"

#include <ovradrcore/err_recorder.h>

#include <gtest/gtest.h>

#include <set>

namespace Ovradr {

namespace {

/// The meaning of a code, as a row of the table.
std::string rowOf(const Failure &failure) {
    return "| " + std::to_string(failure.code) + " | `" + failure.name + "` | " +
           std::to_string(static_cast<int>(failure.exit)) + " | " + failure.message + " ";
}

TEST(Failure, IsDocumentedWithWhatItsCodeMeans) {
    std::multiset<std::string> rows;
    for (const auto &row : OvraTest::DocPage("docs/ovradr.md").rows("Error codes")) {
        std::string text;
        for (const std::string &cell : row) {
            text += "| " + cell + " ";
        }
        rows.insert(text);
    }
    for (int code = 1; code < 1000; ++code) {
        const Failure failure = failureOf(code).value();
        EXPECT_EQ(failure.code, code);
        EXPECT_NE(failure.exit, ExitCode::kOk) << code;
        EXPECT_TRUE(failure.message.ends_with(".") && !failure.hint.empty()) << code;
        if (failure.name == "error_" + std::to_string(code)) {
            EXPECT_EQ(OvraDRCore::ERR::ToString(code), "unknown error") << code;
        } else {
            EXPECT_EQ(rows.erase(rowOf(failure)), 1U)
                << "docs/ovradr.md, \"Error codes\" has to have this row once\n"
                << rowOf(failure);
        }
    }
    for (const std::string &row : rows) {
        ADD_FAILURE() << "docs/ovradr.md, \"Error codes\": failure.cpp has no text for " << row;
    }
}

TEST(Failure, TellsWhatComesWithAnErrorAndMakesItAdviceWhereItIsSome) {
    Json::Value parameter;
    parameter["param"] = "conns";
    parameter["text"] = "has to be one of: a, b";
    Json::Value secret;
    secret["session"] = "s3cret";
    secret["reason"] = "gone";
    const struct {
        int code;
        Json::Value detail;
        const char *message;
        const char *hint = nullptr;
    } cases[] = {
        {100, "no daemon on /x: start it",
         "The appliance could not carry out the request (no daemon on /x).", "Start it."},
        {103, "no such method: look", "The API has no such method."},
        {105, secret,
         R"(The appliance does not permit this request ({"reason":"gone","session":"***"}).)"},
        {106, parameter, "The appliance refused a parameter (conns: has to be one of: a, b)."},
        {401, "conn", "An argument is empty or not valid (conn)."},
        {524, 7, "The request failed (the reply is too large)."},
        {9999, Json::Value(), "Error 9999."},
    };
    for (const auto &each : cases) {
        const Failure found = failureOf(each.code, each.detail).value();
        EXPECT_EQ(found.message, each.message);
        EXPECT_TRUE(each.hint == nullptr || found.hint == each.hint) << found.hint;
    }
}

} // namespace

} // namespace Ovradr
