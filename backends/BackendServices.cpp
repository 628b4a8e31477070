#include "backends/BackendServices.h"

namespace orvanta {

void PendingDatagrams::begin() {
  const platform::MutexLock lock(_mutex);
  ++_count;
}

void PendingDatagrams::end() {
  const platform::MutexLock lock(_mutex);
  if (--_count == 0) _none.notifyAll();
}

bool PendingDatagrams::waitUntilSent(std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  platform::MutexLock lock(_mutex);
  while (_count != 0) {
    if (!_none.waitUntil(lock, deadline)) return _count == 0;
  }
  return true;
}

}  // namespace orvanta
