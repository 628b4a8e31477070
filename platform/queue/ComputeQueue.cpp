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
    const std::lock_guard lock(_mutex);
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
    const std::lock_guard lock(_mutex);
    _stopped = true;
  }
  _changed.notify_all();
  _threads.join();
  std::vector<std::deque<Job>> dropped;  // destroyed without the lock, since what they own may post
  std::deque<std::shared_ptr<ComputeQueue>> line;
  const std::lock_guard lock(_mutex);
  line.swap(_line);
  dropped.reserve(line.size());
  for (const auto& queue : line) dropped.push_back(std::exchange(queue->_jobs, {}));
}

void ComputeThreads::post(ComputeQueue& queue, Job job) {
  {
    const std::lock_guard lock(_mutex);
    if (_stopped) return;  // the parameter goes after the lock
    _count.posted();
    queue._jobs.push_back(std::move(job));
    if (!std::exchange(queue._inLine, true)) {
      _line.push_back(queue.shared_from_this());
      _changed.notify_one();
    }
    if (!_started) return;
  }
  serve();
}

void ComputeThreads::runUntilStopped() {
  std::unique_lock lock(_mutex);
  for (;;) {
    _changed.wait(lock, [this] { return _stopped || !_line.empty(); });
    if (_stopped) return;
    serveFirst(lock);
  }
}

bool ComputeThreads::runOne(std::chrono::milliseconds patience) {
  std::unique_lock lock(_mutex);
  _changed.wait_for(lock, patience, [this] { return _stopped || !_line.empty(); });
  if (_stopped || _line.empty()) return false;
  serveFirst(lock);
  return true;
}

// One job, so that queues take turns.
void ComputeThreads::serveFirst(std::unique_lock<std::mutex>& lock) {
  const std::shared_ptr<ComputeQueue> queue = std::move(_line.front());
  _line.pop_front();
  Job job = std::move(queue->_jobs.front());
  queue->_jobs.pop_front();
  lock.unlock();
  job();
  job.reset();
  _count.ran();
  lock.lock();
  queue->_inLine = !queue->_jobs.empty();
  if (queue->_inLine) _line.push_back(queue);
}

}  // namespace orvanta::platform
