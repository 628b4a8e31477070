#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>

namespace orvanta::platform {

// Counts a pool's posted jobs until they have run, for WorkPool::drain(). Thread-safe.
class JobCount {
 public:
  void posted() { _jobs.fetch_add(1, std::memory_order_relaxed); }
  void ran() {
    if (_jobs.fetch_sub(1) != 1) return;
    if (_waiting.load() == 0) return;
    const std::lock_guard lock(_mutex);
    _none.notify_all();
  }
  bool waitForNone(std::chrono::milliseconds patience) {
    std::unique_lock lock(_mutex);
    ++_waiting;
    const bool none = _none.wait_for(lock, patience, [this] { return _jobs.load() == 0; });
    --_waiting;
    return none;
  }

 private:
  std::atomic<std::size_t> _jobs{0};
  std::atomic<std::size_t> _waiting{0};
  std::mutex _mutex;
  std::condition_variable _none;
};

}  // namespace orvanta::platform
