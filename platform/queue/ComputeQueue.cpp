#include "platform/queue/ComputeQueue.h"

#include <utility>
#include <vector>

namespace orvanta::platform {

void ComputeQueue::post(Job job) {
  _threads->post(*this, std::move(job));
}

ComputeThreads::ComputeThreads(JobCount& count, std::size_t threads, std::size_t extraThreads)
    : _count(count), _threads(*this, "compute", threads, extraThreads) {}

void ComputeThreads::start() {
  {
    const MutexLock lock(_mutex);
    _started = true;
    if (_line.empty()) return;
  }
  serve();
}

void ComputeThreads::serve() {
  if (_threads.start()) return;
  while (runOne(std::chrono::milliseconds(0))) {
  }
}

void ComputeThreads::stop() {
  _threads.closeDown();
  {
    const MutexLock lock(_mutex);
    _stopped = true;
  }
  _changed.notifyAll();
  _threads.join();
  std::vector<std::deque<Job>> dropped;  // destroyed without the lock, since what they own may post
  std::deque<std::shared_ptr<ComputeQueue>> line;
  const MutexLock lock(_mutex);
  line.swap(_line);
  dropped.reserve(line.size());
  for (const auto& queue : line) dropped.push_back(std::exchange(queue->_jobs, {}));
}

void ComputeThreads::post(ComputeQueue& queue, Job job) {
  {
    const MutexLock lock(_mutex);
    if (_stopped) return;  // the parameter goes after the lock
    _count.posted();
    queue._jobs.push_back(std::move(job));
    if (!std::exchange(queue._inLine, true)) {
      _line.push_back(queue.shared_from_this());
      _changed.notifyOne();
    }
    if (!_started) return;
  }
  serve();
}

void ComputeThreads::runUntilStopped() {
  MutexLock lock(_mutex);
  for (;;) {
    while (!_stopped && _line.empty()) _changed.wait(lock);
    if (_stopped) return;
    serveFirst();
  }
}

bool ComputeThreads::runOne(std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  MutexLock lock(_mutex);
  while (!_stopped && _line.empty() && _changed.waitUntil(lock, deadline)) {
  }
  if (_stopped || _line.empty()) return false;
  serveFirst();
  return true;
}

// One job, so that queues take turns.
void ComputeThreads::serveFirst() {
  const std::shared_ptr<ComputeQueue> queue = std::move(_line.front());
  _line.pop_front();
  Job job = std::move(queue->_jobs.front());
  queue->_jobs.pop_front();
  _mutex.unlock();
  job();
  job.reset();
  _count.ran();
  _mutex.lock();
  queue->_inLine = !queue->_jobs.empty();
  if (queue->_inLine) _line.push_back(queue);
}

}  // namespace orvanta::platform
