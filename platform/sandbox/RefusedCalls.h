#pragma once

#include <cstddef>
#include <memory>
#include <thread>
#include <vector>

#include "platform/core/Result.h"
#include "platform/core/UniqueFd.h"
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

// Answers the system calls that the sandbox does not allow, and logs each the first time. A thread of its own does so:
// the kernel lets a refused call wait for it, whatever locks the calling thread holds, which no signal handler could
// do. It sleeps until there is one, and is itself confined to what it needs.
//
// Owned by the Sandbox. Once it is destroyed, refused calls fail unlogged. Made and destroyed on the same thread.
class RefusedCalls {
 public:
  // Starts the watcher, then confines the calling thread and those that it starts later by `calls`.
  static Result<std::unique_ptr<RefusedCalls>> enter(const SandboxCalls& calls);
  ~RefusedCalls();
  RefusedCalls(const RefusedCalls&) = delete;
  RefusedCalls& operator=(const RefusedCalls&) = delete;

 private:
  explicit RefusedCalls(const SandboxCalls& calls);

  struct Watch;
  std::unique_ptr<Watch> _watch;  // shared with the thread, which ends before it
  std::thread _watcher;
};

}  // namespace orvanta::platform
