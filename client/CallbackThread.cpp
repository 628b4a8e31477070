#include "client/CallbackThread.h"

#include <signal.h>

#include <exception>
#include <future>
#include <string>

#include "platform/queue/WorkQueue.h"

namespace orvanta {

namespace {

// Threads inherit the mask of the one that starts them.
class AllSignalsBlocked {
 public:
  AllSignalsBlocked() {
    sigset_t all;
    sigfillset(&all);
    ::pthread_sigmask(SIG_SETMASK, &all, &_before);
  }
  ~AllSignalsBlocked() { ::pthread_sigmask(SIG_SETMASK, &_before, nullptr); }
  AllSignalsBlocked(const AllSignalsBlocked&) = delete;
  AllSignalsBlocked& operator=(const AllSignalsBlocked&) = delete;

 private:
  sigset_t _before{};
};

}  // namespace

CallResult<std::shared_ptr<CallbackThread>> CallbackThread::start() {
  try {
    // One thread and never another, so that callbacks run one at a time.
    auto pool = std::make_unique<platform::WorkPool>(1, 0);
    const AllSignalsBlocked blocked;
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
