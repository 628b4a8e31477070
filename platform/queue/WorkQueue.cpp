#include "platform/queue/WorkQueue.h"

#include <asio/bind_executor.hpp>
#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>
#include <asio/posix/stream_descriptor.hpp>
#include <asio/post.hpp>
#include <asio/steady_timer.hpp>
#include <asio/strand.hpp>
#include <cassert>
#include <cstdint>
#include <stdexcept>
#include <utility>

#include "platform/core/Log.h"
#include "platform/core/Mutex.h"
#include "platform/queue/JobCount.h"
#include "platform/queue/PoolThreads.h"

namespace orvanta::platform {

struct WorkPool::Implementation final : PoolThreads::Loop {
  Implementation(std::size_t threadCount, std::size_t extraThreads)
      : work(io.get_executor()),
        threads(*this, "pool", threadCount, extraThreads),
        compute(std::make_shared<ComputeThreads>(jobs, threadCount, extraThreads)) {}

  void runUntilStopped() override { io.run(); }
  bool runOne(std::chrono::milliseconds timeout) override { return io.run_one_for(timeout) > 0; }

  JobCount jobs;        // outlives the jobs that count down here
  Mutex stopMutex;      // every caller of stop() returns only when the threads are gone
  asio::io_context io;  // goes after `threads`, with the jobs that never ran
  asio::executor_work_guard<asio::io_context::executor_type> work;
  PoolThreads threads;
  const std::shared_ptr<ComputeThreads> compute;
};

namespace {

using Executor = asio::io_context::executor_type;
using Strand = asio::strand<Executor>;

// Tells a completion that has been overtaken by a cancel or a newer setting from one that counts. Touched on the queue
// only; shared with the pending operations, since they end after what they were started from. The handlers live in the
// operations and not here, so that no object that they keep alive keeps itself alive.
struct Arming {
  std::uint64_t current = 0;
  bool armed = false;

  std::uint64_t next() {
    armed = true;
    return ++current;
  }
  void disarm() { armed = false; }
  bool takes(std::uint64_t number) {
    if (!armed || number != current) return false;
    armed = false;
    return true;
  }
};

class StrandQueue final : public WorkQueue {
 public:
  StrandQueue(asio::io_context& io, JobCount& jobs) : _io(io), _jobs(jobs), _strand(asio::make_strand(io)) {}

  void post(Job job) override {
    _jobs.posted();
    asio::post(_strand, [this, job = std::move(job), self = shared_from_this()]() mutable {
      job();
      job.reset();
      _jobs.ran();
    });
  }
  bool isCurrent() const override { return _strand.running_in_this_thread(); }
  std::unique_ptr<Timer> makeTimer() override;
  std::unique_ptr<DescriptorWatch> makeDescriptorWatch(int fd) override;

  asio::io_context& io() { return _io; }

  // A completion handler that runs `job` on this queue unless `arming` has moved on.
  auto completion(const std::shared_ptr<Arming>& arming, Job job) {
    return asio::bind_executor(_strand, [arming, number = arming->next(), job = std::move(job),
                                         self = shared_from_this()](const asio::error_code&) mutable {
      if (arming->takes(number)) job();
    });
  }

 private:
  asio::io_context& _io;
  JobCount& _jobs;
  Strand _strand;
};

class SteadyTimer final : public Timer {
 public:
  explicit SteadyTimer(std::shared_ptr<StrandQueue> queue) : _queue(std::move(queue)), _timer(_queue->io()) {}
  ~SteadyTimer() override { _arming->disarm(); }

  void runAfter(std::chrono::nanoseconds delay, Job handler) override {
    runAt(std::chrono::steady_clock::now() + delay, std::move(handler));
  }
  void runAt(std::chrono::steady_clock::time_point when, Job handler) override {
    assert(_queue->isCurrent());
    _timer.expires_at(when);
    _timer.async_wait(_queue->completion(_arming, std::move(handler)));
  }
  void cancel() override {
    assert(_queue->isCurrent());
    _arming->disarm();
    _timer.cancel();
  }

 private:
  std::shared_ptr<StrandQueue> _queue;
  std::shared_ptr<Arming> _arming = std::make_shared<Arming>();
  asio::basic_waitable_timer<std::chrono::steady_clock, asio::wait_traits<std::chrono::steady_clock>, Executor> _timer;
};

class StrandWatch final : public DescriptorWatch {
 public:
  explicit StrandWatch(std::shared_ptr<StrandQueue> queue) : _queue(std::move(queue)), _descriptor(_queue->io()) {}
  ~StrandWatch() override {
    disarm();
    if (_descriptor.is_open()) _descriptor.release();  // it stays open: it is the caller's
  }

  // Before anything else. False, with a log line, when the descriptor cannot be watched.
  bool assign(int fd) {
    asio::error_code error;
    _descriptor.assign(fd, error);
    if (error) PLATFORM_LOG(error, "DescriptorWatch: Descriptor {} cannot be watched: {}", fd, error.message());
    return !error;
  }
  void whenReadable(Job handler) override {
    wait(asio::posix::descriptor_base::wait_read, _readable, std::move(handler));
  }
  void whenWritable(Job handler) override {
    wait(asio::posix::descriptor_base::wait_write, _writable, std::move(handler));
  }
  void whenHungUp(Job handler) override { wait(asio::posix::descriptor_base::wait_error, _hungUp, std::move(handler)); }
  void cancel() override {
    assert(_queue->isCurrent());
    disarm();
    asio::error_code ignored;
    _descriptor.cancel(ignored);
  }

 private:
  using SharedArming = std::shared_ptr<Arming>;

  void wait(asio::posix::descriptor_base::wait_type what, SharedArming& arming, Job handler) {
    assert(_queue->isCurrent());
    if (!arming) arming = std::make_shared<Arming>();
    _descriptor.async_wait(what, _queue->completion(arming, std::move(handler)));
  }
  void disarm() {
    for (const SharedArming* arming : {&_readable, &_writable, &_hungUp}) {
      if (*arming) (*arming)->disarm();
    }
  }

  std::shared_ptr<StrandQueue> _queue;
  SharedArming _readable, _writable, _hungUp;  // made when first needed
  asio::posix::basic_stream_descriptor<Executor> _descriptor;
};

std::unique_ptr<Timer> StrandQueue::makeTimer() {
  return std::make_unique<SteadyTimer>(std::static_pointer_cast<StrandQueue>(shared_from_this()));
}

std::unique_ptr<DescriptorWatch> StrandQueue::makeDescriptorWatch(int fd) {
  auto watch = std::make_unique<StrandWatch>(std::static_pointer_cast<StrandQueue>(shared_from_this()));
  return watch->assign(fd) ? std::move(watch) : nullptr;
}

}  // namespace

WorkPool::WorkPool(std::size_t threads, std::size_t extraThreads)
    : _implementation(std::make_unique<Implementation>(threads, extraThreads)) {}

// The jobs that never ran are destroyed with the implementation; what they own may still post meanwhile.
WorkPool::~WorkPool() {
  stop();
}

void WorkPool::start() {
  if (!_implementation->threads.start()) throw std::runtime_error("the pool has no thread");
  _implementation->compute->start();
}

void WorkPool::stop() {
  const MutexLock lock(_implementation->stopMutex);
  _implementation->threads.closeDown();
  _implementation->io.stop();
  _implementation->threads.join();
  _implementation->compute->stop();
}

std::shared_ptr<WorkQueue> WorkPool::makeQueue() {
  return std::make_shared<StrandQueue>(_implementation->io, _implementation->jobs);
}

std::shared_ptr<ComputeQueue> WorkPool::makeComputeQueue() {
  return std::make_shared<ComputeQueue>(_implementation->compute);
}

void WorkPool::post(Job job) {
  _implementation->jobs.posted();
  asio::post(_implementation->io, [jobs = &_implementation->jobs, job = std::move(job)]() mutable {
    job();
    job.reset();
    jobs->ran();
  });
}

bool WorkPool::drain(std::chrono::milliseconds timeout) {
  return _implementation->jobs.waitForNone(timeout);
}

std::size_t WorkPool::threadCount() const {
  return _implementation->threads.count();
}

}  // namespace orvanta::platform
