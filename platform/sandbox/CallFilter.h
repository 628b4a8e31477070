#pragma once

#include <cstddef>

#include "platform/core/Result.h"
#include "platform/sandbox/SandboxCalls.h"

namespace orvanta::platform {

// The kernel's filters of system calls. Each holds for the calling thread and all that it starts later, cannot be taken
// back, and needs no-new-privileges. What cannot be put in place says why.

// Applies the profile's rules. Calls that are named nowhere, and limited calls with other arguments, wait for an answer
// at the descriptor that is given back; once that is closed they fail with ENOSYS by themselves. -1: they do so from
// the start, as somebody else watches this process's calls already.
Result<int> filterCalls(const SandboxCalls& calls);

// From now on the calls that were allowed until the start are not permitted (EPERM). Other threads stay as they are.
Result<void> refuseStartCalls(const SandboxCalls& calls);

// Leaves the calling thread nothing but what answering refused calls and logging them takes; all else fails with
// ENOSYS.
Result<void> filterWatcherCalls();

}  // namespace orvanta::platform
