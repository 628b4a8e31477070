#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "backends/OrvantaBackend.h"
#include "platform/HttpClient.h"
#include "platform/WorkQueue.h"

namespace orvanta {

// How many posts of all backends have not reached the HTTP client yet. One per platform. Thread-safe.
class PendingPosts {
 public:
  static std::shared_ptr<PendingPosts> of(platform::Platform& platform);

  void begin();
  void end();
  // Waits until none is left, at most `patience`; whether none is left. Before the HTTP client is shut down, which lets
  // only those requests end that were handed in.
  bool waitUntilHandedIn(std::chrono::milliseconds patience);

 private:
  std::mutex _mutex;
  std::condition_variable _changed;
  std::size_t _count = 0;  // guarded by _mutex
};

// Called exactly once with what came of the post: an error or none. Any thread, none of our locks held.
using PostCompletion = platform::UniqueFunction<void(std::optional<OrvantaError>)>;

// One post on its way, from the hand-in to its completion.
struct Post {
  std::string url;
  std::vector<platform::HttpHeader> headers;  // those that depend on the body are added behind them
  std::string json;
  PostCompletion completion;  // may be empty
};

// Compresses and posts a backend's messages in the order of the calls, away from the queue that answers the client,
// since compressing takes most of what an event costs.
//
// Owned by its backend and by the posts on their way, which do not need the backend: it is held weakly, to be disabled
// when the server answers 5xx. At most 16 MiB wait to be compressed: a caller with more waits in a BlockingScope until
// there is room, so that a program that reports faster than this device compresses is slowed down and loses nothing. A
// message of any size may wait alone.
class PostQueue : public std::enable_shared_from_this<PostQueue> {
 public:
  PostQueue(platform::Platform& platform, std::weak_ptr<OrvantaBackend> backend, std::string backendName);

  // Any thread, without locks: it may wait, and the completion may run at once.
  void post(Post post);

  static constexpr std::size_t kMaximumWaitingBytes = 16U << 20U;

 private:
  class Outcome;
  class Room;
  struct Job;
  void compressAndStart(Job& job);

  // Constant after construction.
  platform::HttpClient& _http;
  const std::shared_ptr<PendingPosts> _pendingPosts;
  const std::weak_ptr<OrvantaBackend> _backend;
  const std::string _backendName;
  const std::shared_ptr<platform::ComputeQueue> _queue;
  const std::shared_ptr<platform::HttpLane> _lane;

  std::mutex _mutex;
  std::condition_variable _roomMade;
  std::size_t _waitingBytes = 0;  // guarded by _mutex
};

}  // namespace orvanta
