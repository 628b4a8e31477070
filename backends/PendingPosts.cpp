#include "backends/PendingPosts.h"

#include <utility>

#include "platform/queue/WorkQueue.h"

namespace orvanta {

bool PendingPosts::hasRoom(const QueueShare& queue, std::size_t bytes) const {
  const auto fits = [bytes](std::size_t used, std::size_t limit) { return used == 0 || used + bytes <= limit; };
  return _ending || (fits(queue.bytes, kMaximumQueueBytes) && fits(_bytes, kMaximumTotalBytes));
}

std::unique_ptr<PendingPosts::Place> PendingPosts::Place::take(std::shared_ptr<PendingPosts> posts,
                                                               std::shared_ptr<QueueShare> queue, std::size_t bytes) {
  PendingPosts& all = *posts;
  std::unique_lock lock(all._mutex);
  if (!all.hasRoom(*queue, bytes)) {
    if (all._waiters == kMaximumWaiters) return nullptr;
    ++all._waiters;
    lock.unlock();
    const platform::BlockingScope blocking;
    lock.lock();
    all._changed.wait(lock, [&] { return all.hasRoom(*queue, bytes); });
    --all._waiters;
  }
  ++all._count;
  all._bytes += bytes;
  queue->bytes += bytes;
  return std::unique_ptr<Place>(new Place(std::move(posts), std::move(queue), bytes));
}

PendingPosts::Place::~Place() {
  giveRoomBack();
  const std::lock_guard lock(_posts->_mutex);
  if (--_posts->_count == 0) _posts->_changed.notify_all();
}

void PendingPosts::Place::giveRoomBack() {
  const std::size_t bytes = std::exchange(_bytes, 0);
  const std::lock_guard lock(_posts->_mutex);
  _posts->_bytes -= bytes;
  _queue->bytes -= bytes;
  if (_posts->_waiters > 0) _posts->_changed.notify_all();
}

void PendingPosts::stopWaiting() {
  const std::lock_guard lock(_mutex);
  _ending = true;
  _changed.notify_all();
}

bool PendingPosts::waitUntilHandedIn(std::chrono::milliseconds patience) {
  std::unique_lock lock(_mutex);
  return _changed.wait_for(lock, patience, [&] { return _count == 0; });
}

}  // namespace orvanta
