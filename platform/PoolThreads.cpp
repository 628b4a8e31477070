#include "platform/PoolThreads.h"

#include <pthread.h>

#include <algorithm>
#include <csignal>
#include <system_error>
#include <utility>

#include "platform/Log.h"

namespace platform {

namespace {

thread_local PoolThreads* tCurrent = nullptr;

// Threads inherit the signal mask: a pool's threads take no signals, which belong to the main thread (or, in a client,
// to a program that knows nothing of us).
class AllSignalsBlocked {
 public:
  AllSignalsBlocked() {
    sigset_t all;
    ::sigfillset(&all);
    ::pthread_sigmask(SIG_SETMASK, &all, &_before);
  }
  ~AllSignalsBlocked() { ::pthread_sigmask(SIG_SETMASK, &_before, nullptr); }
  AllSignalsBlocked(const AllSignalsBlocked&) = delete;
  AllSignalsBlocked& operator=(const AllSignalsBlocked&) = delete;

 private:
  sigset_t _before{};
};

}  // namespace

PoolThreads::PoolThreads(Loop& loop, std::size_t threads, std::size_t extraThreads)
    : _loop(loop), _wanted(std::max<std::size_t>(threads, 1)), _maximum(_wanted + extraThreads) {}

PoolThreads* PoolThreads::current() {
  return tCurrent;
}

void PoolThreads::start() {
  const std::lock_guard lock(_mutex);
  if (_started || _closed) return;
  _started = true;
  for (std::size_t i = 0; i < _wanted; ++i) launch(false);
}

void PoolThreads::launch(bool extra) {
  const AllSignalsBlocked blocked;
  _threads.emplace_back([this, extra] {
    ::pthread_setname_np(::pthread_self(), extra ? "pool-extra" : "pool");
    tCurrent = this;
    if (extra) {
      serveAsExtra();
    } else {
      _loop.runUntilStopped();
    }
  });
  ++_running;
}

void PoolThreads::serveAsExtra() {
  auto look = std::chrono::steady_clock::now() + kLinger;
  for (;;) {
    // Also while there is work: more threads than processors only stand in each other's way.
    if (_loop.runOne(kLinger) && std::chrono::steady_clock::now() < look) continue;
    if (retireIfSuperfluous()) return;
    look = std::chrono::steady_clock::now() + kLinger;
  }
}

bool PoolThreads::superfluous() const {
  return _running - _blocked > _wanted;
}

bool PoolThreads::retireIfSuperfluous() {
  std::thread earlier;
  {
    const std::lock_guard lock(_mutex);
    if (_closed) return true;  // join() takes it from here
    if (!superfluous()) return false;
    --_running;
    const auto self = std::find_if(_threads.begin(), _threads.end(),
                                   [](const std::thread& t) { return t.get_id() == std::this_thread::get_id(); });
    earlier = std::exchange(_retired, std::move(*self));
    _threads.erase(self);
  }
  if (earlier.joinable()) earlier.join();
  return true;
}

void PoolThreads::closeDown() {
  const std::lock_guard lock(_mutex);
  _closed = true;
}

void PoolThreads::join() {
  std::list<std::thread> threads;
  {
    const std::lock_guard lock(_mutex);
    threads.swap(_threads);
    if (_retired.joinable()) threads.push_back(std::move(_retired));
  }
  for (std::thread& thread : threads) thread.join();
  const std::lock_guard lock(_mutex);
  _running -= std::min(_running, threads.size());
}

std::size_t PoolThreads::count() const {
  const std::lock_guard lock(_mutex);
  return _running;
}

void PoolThreads::blockingBegins() {
  const std::lock_guard lock(_mutex);
  ++_blocked;
  if (_closed || _running - _blocked >= _wanted || _running >= _maximum) return;
  try {
    launch(true);
  } catch (const std::system_error& error) {
    PLATFORM_LOG(warning, "WorkPool: No thread can be started beside {} blocked ones: {}", _blocked, error.what());
  }
}

void PoolThreads::blockingEnds() {
  const std::lock_guard lock(_mutex);
  --_blocked;
}

}  // namespace platform
