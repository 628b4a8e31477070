#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <list>
#include <mutex>
#include <thread>

namespace orvanta::platform {

// The threads of a WorkPool: a fixed number, and extra ones that stand in for threads that block.
//
// Owned by its pool. An extra thread steps in when fewer than the fixed number would be left to run jobs. It steps
// aside with the first job, or after kLinger, that finds it superfluous, since threads that share a loop wake each
// other, and ends when it has not been needed for as long again. All operations may be called from any thread.
class PoolThreads {
 public:
  static constexpr std::chrono::milliseconds kLinger{1000};

  // What the threads do: run jobs.
  class Loop {
   public:
    virtual ~Loop() = default;
    virtual void runUntilStopped() = 0;
    // Runs one job; false when none came up for so long, or the loop was stopped.
    virtual bool runOne(std::chrono::milliseconds patience) = 0;
  };

  // `name` is the threads', a literal.
  PoolThreads(Loop& loop, const char* name, std::size_t threads, std::size_t extraThreads);
  PoolThreads(const PoolThreads&) = delete;
  PoolThreads& operator=(const PoolThreads&) = delete;
  ~PoolThreads() = default;  // after join()

  // False when not one thread can be started; it may be tried again.
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
  bool launch(bool extra);   // with _mutex held; whether the system had a thread to give
  bool superfluous() const;  // with _mutex held
  void serveAsExtra();
  // Whether the calling extra thread has to go on; returns when it is needed, or is to end.
  bool stayAside();
  void retire();  // with _mutex held

  // Constant after construction.
  Loop& _loop;
  const char* const _name;
  const std::size_t _wanted;
  const std::size_t _maximum;

  mutable std::mutex _mutex;
  std::condition_variable _needed;
  // Guarded by _mutex.
  std::list<std::thread> _threads;
  std::thread _retired;      // ended or about to, joined by whoever comes next
  std::size_t _running = 0;  // those called back and not yet awake included
  std::size_t _blocked = 0;
  std::size_t _aside = 0;
  std::size_t _calledBack = 0;
  bool _started = false;
  bool _closed = false;
};

}  // namespace orvanta::platform
