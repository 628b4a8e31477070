#pragma once

#include <curl/curl.h>

#include <chrono>
#include <deque>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/http/CurlTransfer.h"
#include "platform/http/HttpClient.h"
#include "platform/http/HttpIntake.h"
#include "platform/http/HttpLaneQueue.h"

namespace orvanta::platform {

// What the HTTP thread does: takes requests from the intake, keeps one of each lane in flight, watches deadlines,
// follows redirects and hands results over. Asleep, without any wake-up, while nothing is in flight. Owned by the
// client, which runs it on its one thread; only wake() may be called from another.
class HttpTransferLoop {
 public:
  // Null when libcurl can make no multi handle. Intake and options outlive the loop.
  static std::unique_ptr<HttpTransferLoop> create(HttpIntake& intake, const HttpClientOptions& options);
  ~HttpTransferLoop();
  HttpTransferLoop(const HttpTransferLoop&) = delete;
  HttpTransferLoop& operator=(const HttpTransferLoop&) = delete;

  // Until the intake says stop; then fails what has not ended.
  void run();
  void wake() { curl_multi_wakeup(_multi); }

  // Requests of limited lanes in flight at once. Unrefused lanes come on top, so that silent servers of others cannot
  // keep them waiting.
  static constexpr std::size_t kMaximumInFlight = 64;

  // Gives a request its result: the observer here and now, the completion where it belongs.
  static void deliver(std::unique_ptr<PendingHttpRequest> request, HttpResult result);

 private:
  using Clock = std::chrono::steady_clock;

  HttpTransferLoop(CURLM* multi, HttpIntake& intake, const HttpClientOptions& options)
      : _multi(multi), _intake(intake), _options(options) {}

  void enqueue(std::unique_ptr<PendingHttpRequest> request);
  void startReady();
  void startNext(HttpLaneQueue& lane);
  // Whether any transfer ended.
  bool harvest();
  void transferDone(PendingHttpRequest& request, CURLcode code);
  void send(PendingHttpRequest& request);
  void expire();
  void sleep();
  void recoverFrom(CURLMcode code);
  enum class Whom { blocking, inFlight, everybody };
  void fail(Whom whom, const std::string& why);
  void finishWaiting(HttpLaneQueue& lane, const PendingHttpRequest& request, HttpResult result);
  void finishCurrent(HttpLaneQueue& lane, HttpResult result);
  void end(std::unique_ptr<PendingHttpRequest> request, HttpResult result);
  // Lists a lane as ready or forgets it, as its requests ask.
  void settle(const std::shared_ptr<HttpLaneQueue>& lane);

  // Constant after construction.
  CURLM* const _multi;
  HttpIntake& _intake;
  const HttpClientOptions& _options;

  // The HTTP thread's.
  std::unordered_map<HttpLaneQueue*, std::shared_ptr<HttpLaneQueue>> _busy;  // lanes with requests
  // Lanes with waiting requests and none in flight: unrefused ones first, then the longest ready. May name some whose
  // requests have ended meanwhile.
  std::deque<std::shared_ptr<HttpLaneQueue>> _ready;
  HttpDeadlines _deadlines;
  std::vector<std::unique_ptr<CurlTransfer>> _spare;
  std::size_t _limitedInFlight = 0;  // requests of limited lanes
  bool _blockingAborted = false;
};

}  // namespace orvanta::platform
