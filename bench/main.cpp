// SPDX-License-Identifier: Apache-2.0

// Compares the library with baselines and prints the rows of docs/performance.md. Run by `make
// bench`, in a sandbox; "send" needs a running ovradrd.

#include "measure.h"
#include "support/sandbox.h"

#include <cstdio>
#include <cstring>

int main(int argc, char **argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: %s cache|db|send\n", argv[0]);
        return 2;
    }
    if (!OvraTest::isSandbox()) {
        OvraTest::explainSandbox(argc, argv);
        return OvraTest::kNotHere;
    }
    const char *rows = argv[1];
    bool good = false;
    if (std::strcmp(rows, "cache") == 0) {
        good = OvraBench::benchCache();
    } else if (std::strcmp(rows, "db") == 0) {
        good = OvraBench::benchDb();
    } else if (std::strcmp(rows, "send") == 0) {
        good = OvraBench::benchSend();
    } else {
        std::fprintf(stderr, "no rows called %s\n", rows);
        return 2;
    }
    return good ? 0 : 1;
}
