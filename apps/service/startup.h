// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <chrono>
#include <exception>
#include <memory>
#include <string>

namespace OvraService {

/// A daemon's exit codes.
enum class ExitCode : int {
    kOk = 0,
    kFailed = 1,
    kUsage = 2,
    kPortInUse = 3,
    kNotSetUp = 9, ///< the same number as in ovradr
};

/// Why a daemon does not start.
struct StartError {
    ExitCode exit = ExitCode::kFailed;
    std::string text; ///< one sentence for people

    StartError(ExitCode code, std::string why)
        : exit(code)
        , text(std::move(why)) {}
    StartError(OvraBase::Error why) // NOLINT(google-explicit-constructor)
        : text(std::move(why.text)) {}
};

/// Reports on standard error and in the log why `program` does not start. \return its exit status
int reportStartError(const char *program, const StartError &why);

/// The same for an exception that ended the start, such as a thread that the system refuses.
int reportStartError(const char *program, const std::exception &why);

/// Opens the system log for a daemon; where there is none, what is logged goes to standard error.
void openLog(const char *program);

/// Raises the soft limit of open file descriptors to `count`, as far as the hard limit allows; a
/// lower limit is a warning in the log.
void raiseDescriptorLimit(unsigned long count);

/// Has the C library keep little of the memory that is freed. Call it before threads start.
void keepMemorySmall();
/// Gives all freed memory back to the system, which a large tree of small pieces otherwise leaves
/// in the holes between what is still in use. Takes milliseconds: call it now and then.
void returnFreedMemory();

/// What a signal asks of a daemon.
enum class Order {
    kNone,
    kReload, ///< SIGHUP
    kEnd,    ///< SIGTERM, SIGINT
};

/// Waits in a thread of its own for the signals that a daemon takes. Those that end it do so in any
/// case: at the latest 10 seconds after the first one came, also while it starts.
class Signals {
public:
    /// Blocks them in this thread and those that it starts, and ignores SIGPIPE.
    Signals();
    /// What has been asked; waits for it at most that long. A reload is told once, the end always.
    Order wait(std::chrono::seconds atMost) const;

private:
    struct State;
    std::shared_ptr<State> state_; // the thread's as well
};

} // namespace OvraService
