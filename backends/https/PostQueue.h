#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/BackendServices.h"
#include "backends/OrvantaBackend.h"
#include "platform/http/HttpClient.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta {

// Called exactly once when the post has ended, with the error or nullopt. On any thread, with no lock of ours held.
using PostCompletion = platform::UniqueFunction<void(std::optional<OrvantaError>)>;

// One post on its way, from its submission to its completion.
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
// when the server answers 5xx. A post for which PendingPosts has no room fails like one that the network lost.
class PostQueue : public std::enable_shared_from_this<PostQueue> {
 public:
  PostQueue(BackendServices& services, std::weak_ptr<OrvantaBackend> backend, std::string backendName);

  // Any thread, without locks: it may wait, and the completion may run at once.
  void post(Post post);

 private:
  class Outcome;
  struct Job;
  void compressAndStart(Job& job);

  // Constant after construction.
  platform::HttpClient& _http;
  const std::shared_ptr<PendingPosts> _pendingPosts;
  const std::weak_ptr<OrvantaBackend> _backend;
  const std::string _backendName;
  const std::shared_ptr<platform::ComputeQueue> _queue;
  const std::shared_ptr<platform::HttpLane> _lane;
  const std::shared_ptr<PendingPosts::QueueShare> _share = std::make_shared<PendingPosts::QueueShare>();
};

}  // namespace orvanta
