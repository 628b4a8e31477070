#pragma once

#include <mutex>

#include "platform/queue/WorkQueue.h"

namespace orvanta {

// The agent's recursive lock. It is held across a storebag fetch, so whoever has to wait for it does so in a
// BlockingScope: waiting sessions never starve others of threads. Meets the standard's Lockable requirements.
class AgentLock {
 public:
  void lock() {
    if (_mutex.try_lock()) return;
    const platform::BlockingScope blocking;
    _mutex.lock();
  }
  bool try_lock() { return _mutex.try_lock(); }
  void unlock() { _mutex.unlock(); }

 private:
  std::recursive_mutex _mutex;
};

}  // namespace orvanta
