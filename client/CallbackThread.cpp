#include "client/CallbackThread.h"

#include <exception>
#include <future>
#include <string>

#include "platform/queue/WorkQueue.h"

namespace orvanta {

CallResult<std::shared_ptr<CallbackThread>> CallbackThread::start() {
  try {
    // One thread and never another, so that callbacks run one at a time. The pool blocks all signals on it.
    auto pool = std::make_unique<platform::WorkPool>(1, 0);
    pool->start();
    return std::shared_ptr<CallbackThread>(new CallbackThread(std::move(pool)));
  } catch (const std::exception& failure) {
    return CallError{std::string("the client library's thread cannot be started: ") + failure.what(),
                     CallErrorKind::connectionLost};
  }
}

CallbackThread::CallbackThread(std::unique_ptr<platform::WorkPool> pool) : _pool(std::move(pool)) {
  std::promise<std::thread::id> id;
  _pool->post([&id] { id.set_value(std::this_thread::get_id()); });
  _id = id.get_future().get();
}

CallbackThread::~CallbackThread() {
  _pool->stop();
}

}  // namespace orvanta
