// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <csignal>
#include <exception>
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

/// Raises the soft limit of open file descriptors to `count`, as far as the hard limit allows; a
/// lower limit is a warning in the log.
void raiseDescriptorLimit(unsigned long count);

/// Has the C library keep little of the memory that is freed. Call it before threads start.
void keepMemorySmall();
/// Gives all freed memory back to the system, which a large tree of small pieces otherwise leaves
/// in the holes between what is still in use. Takes milliseconds: call it now and then.
void returnFreedMemory();

/// Blocks the signals that end a daemon (SIGTERM, SIGINT, SIGHUP) in this thread and those that it
/// starts, so that one thread can wait for them, and ignores SIGPIPE. \return those signals
sigset_t blockEndSignals();

} // namespace OvraService
