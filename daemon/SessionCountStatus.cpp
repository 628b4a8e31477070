#include "daemon/SessionCountStatus.h"

#include <fmt/format.h>

#include <chrono>
#include <mutex>
#include <utility>

#include "platform/host/KeepAlive.h"

namespace orvanta {

namespace {
constexpr std::chrono::milliseconds kDelay{200};
}

struct SessionCountStatus::State {
  std::shared_ptr<platform::WorkQueue> queue;
  std::unique_ptr<platform::Timer> timer;  // owned by queue
  std::mutex mutex;
  std::size_t count = 0;   // guarded by mutex
  bool isWaiting = false;  // guarded by mutex: the timer runs, or is about to

  void tell() {
    const std::lock_guard lock(mutex);
    isWaiting = false;
    // Under the lock, so that the last word is the last number.
    platform::KeepAlive::status(fmt::format("{} session{}", count, count == 1 ? "" : "s"));
  }
};

SessionCountStatus::SessionCountStatus(platform::WorkPool& pool) : _state(std::make_shared<State>()) {
  _state->queue = pool.makeQueue();
}

void SessionCountStatus::changed(std::size_t count) {
  if (!platform::KeepAlive::isHeard()) return;
  {
    const std::lock_guard lock(_state->mutex);
    _state->count = count;
    if (std::exchange(_state->isWaiting, true)) return;
  }
  _state->queue->post([state = _state] {
    if (!state->timer) state->timer = state->queue->makeTimer();
    state->timer->runAfter(kDelay, [weak = std::weak_ptr(state)] {
      if (const auto self = weak.lock()) self->tell();
    });
  });
}

}  // namespace orvanta
