#pragma once

#include <cstddef>
#include <memory>
#include <thread>
#include <vector>

#include "platform/core/Result.h"
#include "platform/core/UniqueFd.h"
#include "platform/sandbox/SandboxProfile.h"

namespace orvanta::platform {

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
