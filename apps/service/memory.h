// SPDX-License-Identifier: Apache-2.0
#pragma once

namespace OvraService {

/// Keeps what a daemon has in its memory to itself: it leaves no core, and only root can look into
/// it (PR_SET_DUMPABLE in prctl(2)). To be called first.
///
/// Programs that are linked with this also wipe every block of the heap that is freed, whoever
/// allocated it: passwords and session ids pass through the buffers of libraries, and a copy that
/// nobody knows of is gone with its block.
///
/// OVRADR_DUMPABLE=1 in the environment leaves cores and debuggers to the user of the process.
void protectMemory();
} // namespace OvraService
