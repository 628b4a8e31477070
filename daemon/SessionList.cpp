#include "daemon/SessionList.h"

#include <fmt/format.h>

#include <algorithm>
#include <utility>

#include "daemon/SessionConnection.h"
#include "interface/OrvantaLogging.h"
#include "platform/host/KeepAlive.h"
#include "platform/host/Process.h"

namespace orvanta {

namespace {
constexpr std::chrono::milliseconds kStatusDelay{200};
constexpr std::chrono::seconds kBetweenReleases{10};
constexpr std::chrono::milliseconds kTimeToRead{1000};
constexpr std::chrono::seconds kEndOfSessions{8};
}  // namespace

struct SessionCountStatus::State {
  std::shared_ptr<platform::WorkQueue> queue;
  std::unique_ptr<platform::Timer> timer;  // used on the queue only
  platform::Mutex mutex;
  std::size_t count GUARDED_BY(mutex) = 0;
  bool isWaiting GUARDED_BY(mutex) = false;  // the timer runs, or is about to

  void tell() {
    const platform::MutexLock lock(mutex);
    isWaiting = false;
    // Under the lock, so that the last status is the last number.
    platform::KeepAlive::status(fmt::format("{} session{}", count, count == 1 ? "" : "s"));
  }
};

SessionCountStatus::SessionCountStatus(platform::WorkPool& pool) : _state(std::make_shared<State>()) {
  _state->queue = pool.makeQueue();
}

void SessionCountStatus::changed(std::size_t count) {
  if (!platform::KeepAlive::isHeard()) return;
  {
    const platform::MutexLock lock(_state->mutex);
    _state->count = count;
    if (std::exchange(_state->isWaiting, true)) return;
  }
  _state->queue->post([state = _state] {
    if (!state->timer) state->timer = state->queue->makeTimer();
    state->timer->runAfter(kStatusDelay, [weak = std::weak_ptr(state)] {
      if (const auto self = weak.lock()) self->tell();
    });
  });
}

SessionList::SessionList(Platform& platform) : _platform(platform), _status(platform.pool()) {}

bool SessionList::admit(const OrvantadSession& session, std::shared_ptr<SessionConnection> connection) {
  const platform::MutexLock lock(_lock);
  if (_isEnding) return false;
  if (_open == 0) _platform.keepAlive().begin();
  _entries.push_back({&session, std::move(connection)});
  ++_unended;
  _status.changed(++_open);
  return true;
}

void SessionList::leave(const OrvantadSession& session) {
  std::shared_ptr<SessionConnection> released;  // destroyed outside the lock
  const platform::MutexLock lock(_lock);
  const auto entry = find(session);
  if (entry == _entries.end() || entry->state != State::open) return;
  entry->state = State::ending;
  released = std::move(entry->connection);
  _status.changed(--_open);
  if (_open == 0) _platform.keepAlive().end();
}

void SessionList::ended(const OrvantadSession& session) {
  const platform::MutexLock lock(_lock);
  if (const auto entry = find(session); entry != _entries.end() && entry->state != State::ended) {
    entry->state = State::ended;
    --_unended;
  }
  if (_unended > 0) return;
  _changed.notifyAll();
  if (!_isEnding) releaseMemoryWhenIdle();
}

void SessionList::connectionEnded(const OrvantadSession& session) {
  const platform::MutexLock lock(_lock);
  if (const auto entry = find(session); entry != _entries.end()) _entries.erase(entry);
  if (_entries.empty()) _changed.notifyAll();
}

std::size_t SessionList::openCount() const {
  const platform::MutexLock lock(_lock);
  return _open;
}

std::vector<SessionList::Entry>::iterator SessionList::find(const OrvantadSession& session) {
  return std::find_if(_entries.begin(), _entries.end(),
                      [&session](const Entry& entry) { return entry.session == &session; });
}

// Returns the memory of the last sessions to the system, but not after each of many short visits.
void SessionList::releaseMemoryWhenIdle() {
  const auto now = std::chrono::steady_clock::now();
  if (now - _memoryReleased < kBetweenReleases) return;
  _memoryReleased = now;
  _platform.pool().post([] {
    const platform::BlockingScope blocking;
    platform::releaseUnusedMemory();
  });
}

bool SessionList::endAll() {
  std::vector<std::shared_ptr<SessionConnection>> open;
  {
    const platform::MutexLock lock(_lock);
    _isEnding = true;
    for (const Entry& entry : _entries) {
      if (entry.state == State::open) open.push_back(entry.connection);
    }
  }
  for (const auto& handler : open) {
    handler->connection()->queue()->post([handler] {
      handler->endSession();
      // The client may take a moment to read the last messages, such as the end of its aggregation.
      handler->connection()->cancel(kTimeToRead);
    });
  }
  // Also waits for sessions whose clients have just left by themselves.
  const auto deadline = std::chrono::steady_clock::now() + kEndOfSessions;
  platform::MutexLock lock(_lock);
  while (_unended > 0 && _changed.waitUntil(lock, deadline)) {
  }
  if (_unended == 0) return true;
  ORVANTA_LOG(error, "main: {} sessions are still busy and are left behind", _unended);
  return false;
}

void SessionList::waitForClients() {
  const auto deadline = std::chrono::steady_clock::now() + kTimeToRead + std::chrono::milliseconds(500);
  platform::MutexLock lock(_lock);
  while (!_entries.empty() && _changed.waitUntil(lock, deadline)) {
  }
}

}  // namespace orvanta
