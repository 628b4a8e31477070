#pragma once

#include <chrono>
#include <cstddef>
#include <memory>

#include "platform/core/UniqueFunction.h"
#include "platform/queue/ComputeQueue.h"

namespace orvanta::platform {

class WorkQueue;
class Timer;
class DescriptorWatch;

// The threads that run the jobs of all queues: one event loop served by a small pool, and as many more for compute
// queues once there is such a job. The fewer serve the loop, the fewer are woken for jobs that take less than the
// waking.
//
// Owned by main (or by a client library instance, or a test) and outlives every queue, timer and watch made from it.
// All operations may be called from any thread unless they say otherwise. Jobs must not throw.
class WorkPool {
 public:
  // `threads` run jobs; BlockingScope may add up to `extraThreads` more while jobs block.
  explicit WorkPool(std::size_t threads, std::size_t extraThreads = 64);
  WorkPool(const WorkPool&) = delete;
  WorkPool& operator=(const WorkPool&) = delete;
  ~WorkPool();  // stops and joins; jobs not yet begun are destroyed uncalled

  // Throws std::runtime_error when the system has no thread to give. Threads start here, not in the constructor, so
  // that a process can enter its sandbox while it has only one.
  void start();
  // Lets running jobs end, joins every thread. Must not be called from a job. Idempotent.
  void stop();

  // Waits until no posted job, on any queue, waits or runs, jobs posted by jobs included; timers and watches do not
  // count. Returns false when that takes longer than `timeout`. Must not be called from a job.
  bool drain(std::chrono::milliseconds timeout);

  std::shared_ptr<WorkQueue> makeQueue();
  std::shared_ptr<ComputeQueue> makeComputeQueue();
  // Runs `job` on some thread of the pool, unordered.
  void post(Job job);

  // Threads that run the loop's jobs now, those added for blocked ones included.
  std::size_t threadCount() const;

 private:
  struct Implementation;
  std::unique_ptr<Implementation> _implementation;
};

// A serial queue: its jobs run one at a time, in the order in which they were posted, on any thread of the pool.
// Shared: each pending job, timer and watch keeps it alive.
class WorkQueue : public std::enable_shared_from_this<WorkQueue> {
 public:
  virtual ~WorkQueue() = default;

  virtual void post(Job job) = 0;
  // Returns whether the calling thread is running one of this queue's jobs. Objects that belong to a queue assert it.
  virtual bool isCurrent() const = 0;

  // A timer and a watch whose handlers run on this queue. Not armed yet.
  virtual std::unique_ptr<Timer> makeTimer() = 0;
  // Watches `fd`, which the caller keeps open until cancel() or the watch's destruction; null if the system refuses.
  virtual std::unique_ptr<DescriptorWatch> makeDescriptorWatch(int fd) = 0;
};

// One-shot timer. Used only on its queue; destroying it cancels it, and no handler runs afterwards.
class Timer {
 public:
  virtual ~Timer() = default;
  // Replaces an earlier setting. The handler runs once, on the queue, unless cancelled first.
  virtual void runAfter(std::chrono::nanoseconds delay, Job handler) = 0;
  virtual void runAt(std::chrono::steady_clock::time_point when, Job handler) = 0;
  virtual void cancel() = 0;
};

// One-shot readiness waits on a descriptor. Used only on its queue; destroying it cancels both waits, and no handler
// runs afterwards. It never closes the descriptor.
class DescriptorWatch {
 public:
  virtual ~DescriptorWatch() = default;
  virtual void whenReadable(Job handler) = 0;
  virtual void whenWritable(Job handler) = 0;
  // The other end was closed, or the connection reset; unlike whenReadable() it does not fire for an end of file that a
  // peer made by shutting down only its sending side.
  virtual void whenHungUp(Job handler) = 0;
  virtual void cancel() = 0;
};

// Held around what blocks a thread of the pool, or keeps it busy for long: meanwhile the pool runs one more thread, so
// that blocked jobs never starve others. On threads that belong to no pool it does nothing.
class BlockingScope {
 public:
  BlockingScope();
  ~BlockingScope();
  BlockingScope(const BlockingScope&) = delete;
  BlockingScope& operator=(const BlockingScope&) = delete;

  // Work that the current thread put off until the end of its job, such as writing gathered replies: run when a
  // BlockingScope begins, since the end may be far away. One per thread; the setter gets the earlier one back.
  using Hook = void (*)(void* context);
  struct HookSetting {
    Hook hook = nullptr;
    void* context = nullptr;
  };
  static HookSetting setBeforeBlocking(HookSetting setting);

 private:
  void* _pool = nullptr;
};

}  // namespace orvanta::platform
