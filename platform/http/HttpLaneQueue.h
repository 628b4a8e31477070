#pragma once

#include <cstddef>
#include <deque>
#include <memory>
#include <utility>

#include "platform/http/HttpClient.h"
#include "platform/http/PendingHttpRequest.h"

namespace orvanta::platform {

// One lane: what waits in it, what is in flight, and the serial queue that its completions run on, so that they come in
// the lane's order. Shared by whoever hands requests in and by the requests themselves.
class HttpLaneQueue final : public HttpLane {
 public:
  HttpLaneQueue(HttpClient::LaneKind laneKind, std::shared_ptr<WorkQueue> completionQueue)
      : kind(laneKind), completions(std::move(completionQueue)) {}

  bool isLimited() const { return kind == HttpClient::LaneKind::limited; }

  // Constant after construction.
  const HttpClient::LaneKind kind;
  const std::shared_ptr<WorkQueue> completions;

  // Guarded by the intake's mutex: the lane's requests from the hand-in to the end, and what they are charged.
  std::size_t unfinished = 0;
  std::size_t charged = 0;

  // The HTTP thread's.
  std::deque<std::unique_ptr<PendingHttpRequest>> waiting;
  std::unique_ptr<PendingHttpRequest> current;  // in flight
  bool listedReady = false;

  // Takes a waiting request out of its turn; null when it is not waiting here.
  std::unique_ptr<PendingHttpRequest> removeWaiting(const PendingHttpRequest* request) {
    for (auto it = waiting.begin(); it != waiting.end(); ++it) {
      if (it->get() != request) continue;
      auto found = std::move(*it);
      waiting.erase(it);
      return found;
    }
    return nullptr;
  }
};

}  // namespace orvanta::platform
