#pragma once

#include <cstddef>

#include "platform/core/Result.h"
#include "platform/sandbox/SandboxProfile.h"

namespace orvanta::platform {

// The kernel's filters of system calls. Each holds for the calling thread and all that it starts later, cannot be taken
// back, and needs no-new-privileges.

// Applies the profile's rules. Calls that are named nowhere, and limited calls with other arguments, wait for an answer
// at the returned descriptor; once that is closed they fail with ENOSYS by themselves. With -1 they do so from the
// start, since another process watches this process's calls already.
Result<int> filterCalls(const SandboxCalls& calls);

// From now on the calls that were allowed until the start are not permitted (EPERM). Other threads stay as they are.
Result<void> refuseStartCalls(const SandboxCalls& calls);

// Allows the calling thread only the calls that answering refused calls and logging them takes; all others fail with
// ENOSYS.
Result<void> filterWatcherCalls();

}  // namespace orvanta::platform
