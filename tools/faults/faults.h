// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <atomic>

namespace OvraTest {

enum class Fault {
    kKill,          ///< the process is killed before the call
    kError,         ///< the call fails with `error`
    kShort,         ///< a write writes half
    kLost,          ///< a change reports success and has no effect
    kNoMemory,      ///< one allocation fails
    kNoMemoryAtAll, ///< this one and all that follow
    kPowerNewNames, ///< the power fails: what was not synchronised is lost, names are as they are
                    ///< now
    kPowerOldNames, ///< the power fails: names, too, are as their folder was synchronised last
    kStop,          ///< the process is stopped before the call
    kClock,         ///< from the call on, the system clock is `error` seconds ahead
};

/// A safety that is switched off, to see that its lack is found.
enum class Lie {
    kNone,
    kSync,    ///< synchronising does nothing
    kRename,  ///< renaming over a file writes into that file
    kJournal, ///< what is written to a rollback journal is dropped
    kLock,    ///< locking does nothing but give way to others
};

struct FaultPlan {
    Fault fault = Fault::kKill;
    int error = 0; ///< of kError; EMFILE concerns opening only, ENOSPC also what changes files
    Lie lie = Lie::kNone;
};

/// The plan of a process, and how far it is.
struct FaultControl {
    FaultPlan plan;
    std::atomic<bool> armed = false;
    std::atomic<bool> met = false;
    std::atomic<int> left = 0; ///< calls, until the one that meets the fault
};
static_assert(std::atomic<int>::is_always_lock_free, "shared between processes");

/// A program into which this file's library is loaded (LD_PRELOAD) shares its control with the
/// test: the variable names the file that both have mapped. It is counted and can be armed at any
/// time.
inline constexpr char kControlVariable[] = "OVRA_FAULTS";

/// From now on, the `at`-th file-system call (or allocation) of this process meets the fault. Calls
/// of libc by any code in this program, SQLite's too, are counted. No file is really synchronised
/// in this program, because a kill does not lose what the kernel holds.
void beginFaults(const FaultPlan &plan, int at);
/// If it was not met, the power fails now. \return whether the fault was met.
bool endFaults();

} // namespace OvraTest
