#pragma once

#include <curl/curl.h>

#include <chrono>
#include <deque>
#include <memory>
#include <string>
#include <thread>
#include <unordered_map>
#include <vector>

#include "platform/http/CurlTransfer.h"
#include "platform/http/HttpClient.h"
#include "platform/http/HttpIntake.h"
#include "platform/http/HttpLaneQueue.h"

namespace orvanta::platform {

// The work of the HTTP thread: takes requests from the intake, keeps one of each lane in flight, watches deadlines,
// follows redirects and delivers results. Asleep, without any wake-up, while nothing is in flight. Owned by the client,
// which runs it on its one thread; only wake() may be called from another.
//
// A request's states, and the step of run() that moves it:
//
//     submitted ---> waiting ---> current ---> ended
//       enqueue()      startNext()  |  ^         finishCurrent(), finishWaiting()
//                                   +--+ a redirect: send() again
//
// It waits in its lane until no other one of the lane is current; lanes take turns through `_ready`, and at most
// kMaximumInFlight requests of limited lanes are current at once, so that many lanes cannot open connections without
// bound. It ends by its answer, its deadline (expire()), an abort or a failure of libcurl (fail()), from either state.
// settle() is what keeps the lists true: after each change it lists the lane as ready, or forgets it.
class HttpTransferLoop {
 public:
  // Null when libcurl cannot make a multi handle. Intake and options outlive the loop.
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

  bool isOnItsThread() const { return std::this_thread::get_id() == _thread; }
  void enqueue(std::unique_ptr<PendingHttpRequest> request);
  void startReady();
  void startNext(HttpLaneQueue& lane);
  // Returns whether any transfer ended.
  bool harvest();
  void transferDone(PendingHttpRequest& request, CURLcode code);
  void send(PendingHttpRequest& request);
  void expire();
  void sleep();
  void recoverFrom(CURLMcode code);
  enum class Whom { blocking, inFlight, all };
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
  std::thread::id _thread;                                                   // the one in run()
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
