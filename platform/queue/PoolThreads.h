#pragma once

#include <chrono>
#include <cstddef>
#include <list>
#include <thread>

#include "platform/core/Mutex.h"

namespace orvanta::platform {

// The threads of a WorkPool: a fixed number, and extra ones that stand in for threads that block.
//
// Owned by its pool. The fixed threads run jobs until the loop stops. An extra thread goes through these states:
//
//     blockingBegins() ---> running ---superfluous after a job or kLinger---> aside ---kLinger---> retired
//                              ^                                                |
//                              +------------called back (_calledBack)----------+
//
// It steps in when blocked threads would leave fewer than the fixed number to run jobs (_running - _blocked < _wanted),
// and steps aside because threads that share a loop wake each other. Aside it can be called back for less than a new
// thread costs. A retired thread has left _threads; the next one to retire, or join(), joins it. After closeDown() no
// state changes but to the end. All operations may be called from any thread.
class PoolThreads {
 public:
  static constexpr std::chrono::milliseconds kLinger{1000};

  // The threads' work: running jobs.
  class Loop {
   public:
    virtual ~Loop() = default;
    virtual void runUntilStopped() = 0;
    // Runs one job; false when none came up within `timeout`, or the loop was stopped.
    virtual bool runOne(std::chrono::milliseconds timeout) = 0;
  };

  // `name` is the threads', a literal.
  PoolThreads(Loop& loop, const char* name, std::size_t threads, std::size_t extraThreads);
  PoolThreads(const PoolThreads&) = delete;
  PoolThreads& operator=(const PoolThreads&) = delete;
  ~PoolThreads() = default;  // after join()

  // Returns false when not one thread can be started; may be called again.
  bool start();
  // From now on no thread starts. The loop is to be stopped between this and join().
  void closeDown();
  void join();
  // Those that run jobs or are blocked in one.
  std::size_t count() const;

  // Around a stretch in which the calling thread, one of these, does nothing for the loop.
  void blockingBegins();
  void blockingEnds();

  // The threads that the calling thread belongs to; null outside every pool.
  static PoolThreads* current();

 private:
  // Returns false when the system has no thread to give.
  bool launch(bool extra) REQUIRES(_mutex);
  bool superfluous() const REQUIRES(_mutex);
  void serveAsExtra();
  // Waits until the calling extra thread is needed or is to end, and returns whether it is needed.
  bool stayAside();
  void retire() REQUIRES(_mutex);

  // Constant after construction.
  Loop& _loop;
  const char* const _name;
  const std::size_t _wanted;
  const std::size_t _maximum;

  mutable Mutex _mutex;
  Condition _needed;
  std::list<std::thread> _threads GUARDED_BY(_mutex);
  std::thread _retired GUARDED_BY(_mutex);      // ended or about to; the next one to retire joins it
  std::size_t _running GUARDED_BY(_mutex) = 0;  // those called back and not yet awake included
  std::size_t _blocked GUARDED_BY(_mutex) = 0;
  std::size_t _aside GUARDED_BY(_mutex) = 0;
  std::size_t _calledBack GUARDED_BY(_mutex) = 0;
  bool _started GUARDED_BY(_mutex) = false;
  bool _closed GUARDED_BY(_mutex) = false;
};

}  // namespace orvanta::platform
