#pragma once

#include <chrono>
#include <cstddef>
#include <memory>

#include "platform/core/Mutex.h"

namespace orvanta {

// The posts of all backends that wait to be compressed: how many, and how much memory they may take. Owned by
// BackendServices and shared with the posts, some of which go after it. Thread-safe.
//
// A session that brings more than there is room for waits, so that a program that reports faster than this device
// compresses is slowed down. When kMaximumWaiters wait already it is refused instead; when the daemon ends there is
// room for all.
class PendingPosts {
 public:
  static constexpr std::size_t kMaximumQueueBytes = 16U << 20U;
  static constexpr std::size_t kMaximumTotalBytes = 64U << 20U;
  static constexpr std::size_t kMaximumWaiters = 16;

  // One queue's share. Shared by the queue and its posts.
  struct QueueShare {
    std::size_t bytes = 0;  // guarded by the posts' mutex
  };

  // One post's room, held while the object lives.
  class Reservation {
   public:
    // Returns null when there is no room and too many wait for it already. A post of any size may wait alone. Called
    // without locks, since it may wait in a BlockingScope.
    static std::unique_ptr<Reservation> take(std::shared_ptr<PendingPosts> posts, std::shared_ptr<QueueShare> queue,
                                             std::size_t bytes);
    ~Reservation();
    Reservation(const Reservation&) = delete;
    Reservation& operator=(const Reservation&) = delete;
    // The post has been compressed: its text takes no room any more.
    void giveRoomBack();

   private:
    Reservation(std::shared_ptr<PendingPosts> posts, std::shared_ptr<QueueShare> queue, std::size_t bytes)
        : _posts(std::move(posts)), _queue(std::move(queue)), _bytes(bytes) {}

    const std::shared_ptr<PendingPosts> _posts;
    const std::shared_ptr<QueueShare> _queue;
    std::size_t _bytes;
  };

  // For ending: from now on there is room for every post, and none waits.
  void stopWaiting();
  // Waits until the HTTP client has every post, at most `timeout`. Returns whether it has. For tests.
  bool waitUntilSubmitted(std::chrono::milliseconds timeout);

 private:
  bool hasRoom(const QueueShare& queue, std::size_t bytes) const REQUIRES(_mutex);

  platform::Mutex _mutex;
  platform::Condition _changed;
  std::size_t _count GUARDED_BY(_mutex) = 0;
  std::size_t _bytes GUARDED_BY(_mutex) = 0;
  std::size_t _waiters GUARDED_BY(_mutex) = 0;
  bool _ending GUARDED_BY(_mutex) = false;
};

}  // namespace orvanta
