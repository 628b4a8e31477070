#pragma once

#include <chrono>
#include <cstddef>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <utility>

#include "platform/http/CurlTransfer.h"
#include "platform/http/HttpClient.h"
#include "platform/http/HttpHeaderList.h"

namespace orvanta::platform {

class HttpLaneQueue;
struct PendingHttpRequest;

using HttpDeadlines = std::multimap<std::chrono::steady_clock::time_point, PendingHttpRequest*>;

// A request from its submission to its end. Owned by the intake, then by its lane; the HTTP thread's from the moment
// when it takes it from the intake.
struct PendingHttpRequest {
  HttpRequest request;
  HttpHeaderList headers;  // of `request`, until it is in flight
  std::shared_ptr<HttpLaneQueue> lane;
  std::optional<std::chrono::steady_clock::time_point> deadline;
  HttpClient::Observer observe;       // on the HTTP thread
  HttpClient::Completion completion;  // on the lane's queue, or on the HTTP thread for a blocking request
  bool blocking = false;              // a thread waits in perform()
  std::size_t charge = 0;             // bytes that count towards the limits

  // The HTTP thread's own.
  std::unique_ptr<CurlTransfer> transfer;  // while in flight
  HttpDeadlines::iterator deadlineEntry;   // valid while deadline is set
};

// One lane: what waits in it, what is in flight, and the serial queue that its completions run on, so that they come in
// the lane's order. Shared by its callers and by its requests.
class HttpLaneQueue final : public HttpLane {
 public:
  HttpLaneQueue(HttpClient::LaneKind laneKind, std::shared_ptr<WorkQueue> completionQueue)
      : kind(laneKind), completions(std::move(completionQueue)) {}

  bool isLimited() const { return kind == HttpClient::LaneKind::limited; }

  // Constant after construction.
  const HttpClient::LaneKind kind;
  const std::shared_ptr<WorkQueue> completions;

  // Guarded by the intake's mutex: the lane's requests from submission to the end, and what they are charged.
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
