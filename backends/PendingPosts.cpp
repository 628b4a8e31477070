#include "backends/PendingPosts.h"

#include <utility>

#include "platform/queue/WorkQueue.h"

namespace orvanta {

bool PendingPosts::hasRoom(const QueueShare& queue, std::size_t bytes) const {
  const auto fits = [bytes](std::size_t used, std::size_t limit) { return used == 0 || used + bytes <= limit; };
  return _ending || (fits(queue.bytes, kMaximumQueueBytes) && fits(_bytes, kMaximumTotalBytes));
}

std::unique_ptr<PendingPosts::Reservation> PendingPosts::Reservation::take(std::shared_ptr<PendingPosts> posts,
                                                                           std::shared_ptr<QueueShare> queue,
                                                                           std::size_t bytes) {
  PendingPosts& all = *posts;
  platform::MutexLock lock(all._mutex);
  if (!all.hasRoom(*queue, bytes)) {
    if (all._waiters == kMaximumWaiters) return nullptr;
    ++all._waiters;
    lock.unlock();
    const platform::BlockingScope blocking;
    lock.lock();
    while (!all.hasRoom(*queue, bytes)) all._changed.wait(lock);
    --all._waiters;
  }
  ++all._count;
  all._bytes += bytes;
  queue->bytes += bytes;
  return std::unique_ptr<Reservation>(new Reservation(std::move(posts), std::move(queue), bytes));
}

PendingPosts::Reservation::~Reservation() {
  giveRoomBack();
  const platform::MutexLock lock(_posts->_mutex);
  if (--_posts->_count == 0) _posts->_changed.notifyAll();
}

void PendingPosts::Reservation::giveRoomBack() {
  const std::size_t bytes = std::exchange(_bytes, 0);
  const platform::MutexLock lock(_posts->_mutex);
  _posts->_bytes -= bytes;
  _queue->bytes -= bytes;
  if (_posts->_waiters > 0) _posts->_changed.notifyAll();
}

void PendingPosts::stopWaiting() {
  const platform::MutexLock lock(_mutex);
  _ending = true;
  _changed.notifyAll();
}

bool PendingPosts::waitUntilSubmitted(std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  platform::MutexLock lock(_mutex);
  while (_count != 0) {
    if (!_changed.waitUntil(lock, deadline)) return _count == 0;
  }
  return true;
}

}  // namespace orvanta
