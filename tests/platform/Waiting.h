#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <thread>

namespace orvanta::test {

// How long something may take before the test counts as hung; nothing should come near it.
inline constexpr std::chrono::seconds kHangGuard{30};

// Ends the process: a test that went on, or left, would take its locals from under the threads that hang.
[[noreturn]] inline void hung(const char* what) {
  std::fprintf(stderr, "%s has not come within %lld s\n", what, static_cast<long long>(kHangGuard.count()));
  std::abort();
}

// True once `condition`, asked again and again, has come true.
template <class Condition>
bool eventually(Condition condition) {
  const auto end = std::chrono::steady_clock::now() + kHangGuard;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > end) hung("a condition");
    std::this_thread::yield();
  }
  return true;
}

// A count that threads raise and a test waits for.
class Counter {
 public:
  void add() {
    const std::lock_guard lock(_mutex);
    ++_value;
    _changed.notify_all();
  }
  int value() const {
    const std::lock_guard lock(_mutex);
    return _value;
  }
  bool waitFor(int value) {
    std::unique_lock lock(_mutex);
    if (!_changed.wait_for(lock, kHangGuard, [&] { return _value >= value; })) hung("a count");
    return true;
  }

 private:
  mutable std::mutex _mutex;
  std::condition_variable _changed;
  int _value = 0;  // guarded by _mutex
};

}  // namespace orvanta::test
