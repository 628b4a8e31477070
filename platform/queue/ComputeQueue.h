#pragma once

#include <chrono>
#include <cstddef>
#include <deque>
#include <memory>

#include "platform/core/Mutex.h"
#include "platform/core/UniqueFunction.h"
#include "platform/queue/JobCount.h"
#include "platform/queue/PoolThreads.h"

namespace orvanta::platform {

using Job = UniqueFunction<void()>;

class ComputeThreads;

// A serial queue beside the event loop, for jobs that compute for long, such as compressing: jobs of the loop do
// not wait for them. Its jobs run one at a time, in the order in which they were posted, on threads of their
// own.
//
// Shared: each pending job keeps it alive. Any thread may call it. Jobs must not throw.
class ComputeQueue final : public std::enable_shared_from_this<ComputeQueue> {
 public:
  // Use WorkPool::makeComputeQueue().
  explicit ComputeQueue(std::shared_ptr<ComputeThreads> threads) : _threads(std::move(threads)) {}

  // Once the pool has stopped, `job` is destroyed uncalled.
  void post(Job job);

 private:
  friend class ComputeThreads;

  const std::shared_ptr<ComputeThreads> _threads;

  // Guarded by the threads' mutex, which the annotations cannot name from here; touched by ComputeThreads alone.
  std::deque<Job> _jobs;
  bool _inLine = false;  // in the line, or served by a thread
};

// The threads that serve compute queues. They start with the first job. Shared by the pool, which stops them, and the
// queues, which may outlive it.
class ComputeThreads final : PoolThreads::Loop {
 public:
  // `count` is the pool's, which outlives stop().
  ComputeThreads(JobCount& count, std::size_t threads, std::size_t extraThreads);

  // Until now jobs only wait.
  void start();
  // Lets running jobs end, joins the threads and destroys the jobs that did not begin. Idempotent; not from a job.
  void stop();

 private:
  friend class ComputeQueue;

  void post(ComputeQueue& queue, Job job);
  void runUntilStopped() override;
  bool runOne(std::chrono::milliseconds timeout) override;
  // Starts the threads unless they run. When the system has no thread to give, the caller's does the work.
  void serve();
  // Releases the mutex while the job runs.
  void serveFirst() REQUIRES(_mutex);

  JobCount& _count;

  Mutex _mutex;
  Condition _changed;
  // Queues with jobs that are not being served, the longest waiting first.
  std::deque<std::shared_ptr<ComputeQueue>> _line GUARDED_BY(_mutex);
  bool _started GUARDED_BY(_mutex) = false;
  bool _stopped GUARDED_BY(_mutex) = false;

  PoolThreads _threads;
};

}  // namespace orvanta::platform
