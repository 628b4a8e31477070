#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>

namespace orvanta {

// The posts of all backends that wait to be compressed: how many, and how much memory they may take. Owned by
// BackendServices and shared with the posts, some of which go after it. Thread-safe.
//
// Who brings more than there is room for waits, so that a program that reports faster than this device compresses is
// slowed down. When kMaximumWaiters wait already it is refused instead; when the daemon ends there is room for all.
class PendingPosts {
 public:
  static constexpr std::size_t kMaximumQueueBytes = 16U << 20U;
  static constexpr std::size_t kMaximumTotalBytes = 64U << 20U;
  static constexpr std::size_t kMaximumWaiters = 16;

  // One queue's share. Shared by the queue and its posts.
  struct QueueShare {
    std::size_t bytes = 0;  // guarded by the posts' mutex
  };

  // One post, counted while it lives.
  class Place {
   public:
    // Null when there is no room and no waiting for it. A post of any size may wait alone. Called without
    // locks, since it may wait in a BlockingScope.
    static std::unique_ptr<Place> take(std::shared_ptr<PendingPosts> posts, std::shared_ptr<QueueShare> queue,
                                       std::size_t bytes);
    ~Place();
    Place(const Place&) = delete;
    Place& operator=(const Place&) = delete;
    // The post has been compressed: its text takes no room any more.
    void giveRoomBack();

   private:
    Place(std::shared_ptr<PendingPosts> posts, std::shared_ptr<QueueShare> queue, std::size_t bytes)
        : _posts(std::move(posts)), _queue(std::move(queue)), _bytes(bytes) {}

    const std::shared_ptr<PendingPosts> _posts;
    const std::shared_ptr<QueueShare> _queue;
    std::size_t _bytes;
  };

  // For ending: nobody waits for room from now on, there is room for whatever comes.
  void stopWaiting();
  // Waits until no post is left that the HTTP client has not got, at most `patience`; whether none is left.
  // For tests.
  bool waitUntilHandedIn(std::chrono::milliseconds patience);

 private:
  bool hasRoom(const QueueShare& queue, std::size_t bytes) const;  // with _mutex held

  std::mutex _mutex;
  std::condition_variable _changed;
  // Guarded by _mutex.
  std::size_t _count = 0;
  std::size_t _bytes = 0;
  std::size_t _waiters = 0;
  bool _ending = false;
};

}  // namespace orvanta
