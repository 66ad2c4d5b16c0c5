// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <functional>
#include <string>

namespace OvraBench {

using Work = std::function<void()>;

/// Median and spread of one figure over the rounds of a comparison.
struct Spread {
    double low = 0;
    double median = 0;
    double high = 0;
};

struct Comparison {
    Spread ours;  ///< microseconds for one call
    Spread floor; ///< microseconds for one call
    Spread ratio; ///< ours / floor, round by round
};

/// Runs the two alternately, one batch of calls each, so that drift in the machine's speed affects
/// both alike.
/// \param calls   calls per batch
/// \param rounds  measured pairs of batches, after one warm-up pair
Comparison compare(int calls, int rounds, const Work &ours, const Work &floor);

/// Prints one row of the table: the operations, both times, the ratio and its upper bound. \return
/// whether the median is within the bound.
bool report(const std::string &what, const Comparison &comparison, double bound);

// Each runs its rows. \return whether all are within their bounds.
bool benchCache();
bool benchDb();
bool benchSend();

} // namespace OvraBench
