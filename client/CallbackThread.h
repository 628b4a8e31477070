#pragma once

#include <memory>
#include <thread>

#include "interface/Reply.h"

namespace orvanta::platform {
class WorkPool;
}

namespace orvanta {

// The thread on which the library calls back. Each connection starts one of its own, unless several are given the same
// one (ConnectionOptions::callbackThread), whose callbacks then run one at a time.
//
// Shared by the connections and the program. All operations may be called from any thread. It blocks every signal, so
// that the program's handlers run on the program's own threads.
class CallbackThread {
 public:
  // Fails when the system is out of threads or descriptors.
  static CallResult<std::shared_ptr<CallbackThread>> start();
  CallbackThread(const CallbackThread&) = delete;
  CallbackThread& operator=(const CallbackThread&) = delete;
  // Joins the thread, so it must not run on the thread itself: a connection that is destroyed there sees to that.
  ~CallbackThread();

  // Returns whether the caller runs on this thread, where waiting for an answer would never end.
  bool isCurrent() const { return std::this_thread::get_id() == _id; }

  // For the library alone.
  platform::WorkPool& pool() { return *_pool; }

 private:
  explicit CallbackThread(std::unique_ptr<platform::WorkPool> pool);

  // Constant after construction.
  const std::unique_ptr<platform::WorkPool> _pool;
  std::thread::id _id;
};

}  // namespace orvanta
