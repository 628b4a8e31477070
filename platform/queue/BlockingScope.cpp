#include <utility>

#include "platform/queue/PoolThreads.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

namespace {
thread_local BlockingScope::HookSetting tHook;
thread_local bool tInsideScope = false;
}  // namespace

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
