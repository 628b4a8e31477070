#include "platform/queue/PoolThreads.h"

#include <pthread.h>

#include <algorithm>
#include <cassert>
#include <system_error>
#include <utility>

#include "platform/core/Log.h"
#include "platform/core/SignalMask.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

namespace {

thread_local PoolThreads* tCurrent = nullptr;

// Of BlockingScope.
thread_local BlockingScope::HookSetting tHook;
thread_local bool tInsideScope = false;

}  // namespace

PoolThreads::PoolThreads(Loop& loop, const char* name, std::size_t threads, std::size_t extraThreads)
    : _loop(loop), _name(name), _wanted(std::max<std::size_t>(threads, 1)), _maximum(_wanted + extraThreads) {}

PoolThreads* PoolThreads::current() {
  return tCurrent;
}

bool PoolThreads::start() {
  const MutexLock lock(_mutex);
  if (_started || _closed) return true;
  for (std::size_t i = 0; i < _wanted && launch(false); ++i) _started = true;
  return _started;
}

bool PoolThreads::launch(bool extra) {
  const AllSignalsBlocked blocked;
  const auto run = [this, extra] {
    ::pthread_setname_np(::pthread_self(), _name);
    tCurrent = this;
    if (extra) {
      serveAsExtra();
    } else {
      _loop.runUntilStopped();
    }
  };
  try {
    _threads.emplace_back(run);
  } catch (const std::system_error& error) {
    PLATFORM_LOG(warning, "WorkPool: No thread can be started beside {}, {} of them blocked: {}", _running, _blocked,
                 error.what());
    return false;
  }
  ++_running;
  return true;
}

void PoolThreads::serveAsExtra() {
  do {
    _loop.runOne(kLinger);
  } while (stayAside());
}

bool PoolThreads::superfluous() const {
  return _running - _blocked > _wanted;
}

bool PoolThreads::stayAside() {
  MutexLock lock(_mutex);
  if (_closed) return false;  // join() takes it from here
  if (!superfluous()) return true;
  --_running;
  ++_aside;
  const auto deadline = std::chrono::steady_clock::now() + kLinger;
  while (!_closed && _calledBack == 0 && _needed.waitUntil(lock, deadline)) {
  }
  if (_calledBack > 0) {
    --_calledBack;
    return !_closed;
  }
  --_aside;
  if (!_closed) retire();
  return false;
}

void PoolThreads::retire() {
  const auto self = std::find_if(_threads.begin(), _threads.end(),
                                 [](const std::thread& t) { return t.get_id() == std::this_thread::get_id(); });
  std::thread earlier = std::exchange(_retired, std::move(*self));
  _threads.erase(self);
  if (earlier.joinable()) earlier.join();  // has nothing left to do
}

void PoolThreads::closeDown() {
  const MutexLock lock(_mutex);
  _closed = true;
  _needed.notifyAll();
}

void PoolThreads::join() {
  std::list<std::thread> threads;
  {
    const MutexLock lock(_mutex);
    threads.swap(_threads);
    if (_retired.joinable()) threads.push_back(std::move(_retired));
  }
  for (std::thread& thread : threads) thread.join();
  const MutexLock lock(_mutex);
  _running -= std::min(_running, threads.size());
}

std::size_t PoolThreads::count() const {
  const MutexLock lock(_mutex);
  return _running;
}

void PoolThreads::blockingBegins() {
  assert(current() == this);
  const MutexLock lock(_mutex);
  ++_blocked;
  if (_closed || _running - _blocked >= _wanted || _running >= _maximum) return;
  if (_aside > 0) {
    --_aside;
    ++_calledBack;
    ++_running;
    _needed.notifyOne();
    return;
  }
  launch(true);
}

void PoolThreads::blockingEnds() {
  assert(current() == this);
  const MutexLock lock(_mutex);
  --_blocked;
}

BlockingScope::BlockingScope() {
  if (tHook.hook != nullptr) tHook.hook(tHook.context);
  PoolThreads* const threads = PoolThreads::current();
  if (threads == nullptr || tInsideScope) return;  // a thread blocks once, however deep the scopes
  tInsideScope = true;
  _pool = threads;
  threads->blockingBegins();
}

BlockingScope::~BlockingScope() {
  if (_pool == nullptr) return;
  static_cast<PoolThreads*>(_pool)->blockingEnds();
  tInsideScope = false;
}

BlockingScope::HookSetting BlockingScope::setBeforeBlocking(HookSetting setting) {
  return std::exchange(tHook, setting);
}

}  // namespace orvanta::platform
