#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>

#include "platform/core/Mutex.h"

namespace orvanta::platform {

// Counts a pool's posted jobs until they have run, for WorkPool::drain(). Thread-safe.
class JobCount {
 public:
  void posted() { _jobs.fetch_add(1, std::memory_order_relaxed); }
  void ran() {
    if (_jobs.fetch_sub(1) != 1) return;
    if (_waiting.load() == 0) return;
    const MutexLock lock(_mutex);
    _none.notifyAll();
  }
  // Returns false when jobs were left at the end of `timeout`.
  bool waitForNone(std::chrono::milliseconds timeout) {
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    MutexLock lock(_mutex);
    ++_waiting;
    bool none = _jobs.load() == 0;
    for (bool inTime = true; !none && inTime; none = _jobs.load() == 0) inTime = _none.waitUntil(lock, deadline);
    --_waiting;
    return none;
  }

 private:
  std::atomic<std::size_t> _jobs{0};
  std::atomic<std::size_t> _waiting{0};
  Mutex _mutex;
  Condition _none;  // waited for and notified under _mutex, so that no notification is lost
};

}  // namespace orvanta::platform
