#pragma once

#include <chrono>
#include <cstddef>
#include <map>
#include <memory>
#include <optional>

#include "platform/http/CurlTransfer.h"
#include "platform/http/HttpClient.h"
#include "platform/http/HttpHeaderList.h"

namespace orvanta::platform {

class HttpLaneQueue;
struct PendingHttpRequest;

using HttpDeadlines = std::multimap<std::chrono::steady_clock::time_point, PendingHttpRequest*>;

// A request from its hand-in to its end. Owned by the intake, then by its lane; the HTTP thread's from the moment when
// it takes it from the intake.
struct PendingHttpRequest {
  HttpRequest request;
  HttpHeaderList headers;  // of `request`, until it is in flight
  std::shared_ptr<HttpLaneQueue> lane;
  std::optional<std::chrono::steady_clock::time_point> deadline;
  HttpClient::Observer observe;       // on the HTTP thread
  HttpClient::Completion completion;  // on the lane's queue, or on the HTTP thread for a blocking request
  bool blocking = false;              // somebody sits in perform()
  std::size_t charge = 0;             // bytes that count towards the limits

  // The HTTP thread's own.
  std::unique_ptr<CurlTransfer> transfer;  // while in flight
  HttpDeadlines::iterator deadlineEntry;   // valid while deadline is set
};

}  // namespace orvanta::platform
