// SPDX-License-Identifier: Apache-2.0
#include "measure.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <vector>

namespace OvraBench {

namespace {

double timePerCall(int calls, const Work &work) {
    const auto start = std::chrono::steady_clock::now();
    for (int i = 0; i < calls; ++i) {
        work();
    }
    const std::chrono::duration<double, std::micro> took = std::chrono::steady_clock::now() - start;
    return took.count() / calls;
}

Spread spreadOf(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    return {values.front(), values[values.size() / 2], values.back()};
}

} // namespace

Comparison compare(int calls, int rounds, const Work &ours, const Work &floor) {
    std::vector<double> oursTimes;
    std::vector<double> floorTimes;
    std::vector<double> ratios;
    for (int round = 0; round <= rounds; ++round) {
        const double first = timePerCall(calls, ours);
        const double second = timePerCall(calls, floor);
        if (round == 0) {
            continue; // warms up
        }
        oursTimes.push_back(first);
        floorTimes.push_back(second);
        ratios.push_back(first / second);
    }
    return {spreadOf(oursTimes), spreadOf(floorTimes), spreadOf(ratios)};
}

bool report(const std::string &what, const Comparison &comparison, double bound) {
    const bool within = comparison.ratio.median <= bound;
    std::printf("| %s | %.1f (%.1f–%.1f) | %.1f (%.1f–%.1f) | %.2f (%.2f–%.2f) | %.1f | %s |\n",
                what.c_str(), comparison.ours.median, comparison.ours.low, comparison.ours.high,
                comparison.floor.median, comparison.floor.low, comparison.floor.high,
                comparison.ratio.median, comparison.ratio.low, comparison.ratio.high, bound,
                within ? "yes" : "**no**");
    std::fflush(stdout);
    return within;
}

} // namespace OvraBench
