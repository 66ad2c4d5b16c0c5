// SPDX-License-Identifier: Apache-2.0

// The main function of every test program. Its cases run only in a sandbox; listing them works
// anywhere.

#include "support/sandbox.h"

#include <gtest/gtest.h>

#include <vector>

int main(int argc, char **argv) {
    const std::vector<const char *> asGiven(argv, argv + argc); // gtest removes its own
    testing::InitGoogleTest(&argc, argv);
    if (!GTEST_FLAG_GET(list_tests) && !OvraTest::isSandbox()) {
        OvraTest::explainSandbox(static_cast<int>(asGiven.size()), asGiven.data());
        return OvraTest::kNotHere;
    }
    return RUN_ALL_TESTS();
}
