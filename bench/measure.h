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

/// Runs the two in turn, a batch of calls each, so that a machine whose speed drifts treats both
/// alike.
/// \param calls   calls in a batch
/// \param rounds  pairs of batches that count, after one that does not
Comparison compare(int calls, int rounds, const Work &ours, const Work &floor);

/// Prints one row of the table: what was compared, both times, the ratio and what it may be at
/// most. \return whether the median is within the bound.
bool report(const std::string &what, const Comparison &comparison, double bound);

// Each runs its rows. \return whether all of them are within their bounds.
bool benchCache();
bool benchDb();
bool benchSend();

} // namespace OvraBench
