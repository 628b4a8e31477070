#include "platform/http/HttpTransferLoop.h"

#include <fmt/format.h>

#include <algorithm>
#include <cassert>
#include <limits>
#include <utility>

#include "platform/core/Log.h"
#include "platform/http/HttpRedirect.h"

namespace orvanta::platform {

namespace {

// Handles, and connections without a request, kept for the next requests.
constexpr std::size_t kSpareTransfers = 8;
constexpr long kKeptConnections = 16;

HttpResult failure(std::string why) {
  return {std::nullopt, std::move(why)};
}

}  // namespace

std::unique_ptr<HttpTransferLoop> HttpTransferLoop::create(HttpIntake& intake, const HttpClientOptions& options) {
  CURLM* const multi = curl_multi_init();
  if (multi == nullptr) return nullptr;
  curl_multi_setopt(multi, CURLMOPT_MAXCONNECTS, kKeptConnections);
  return std::unique_ptr<HttpTransferLoop>(new HttpTransferLoop(multi, intake, options));
}

HttpTransferLoop::~HttpTransferLoop() {
  _spare.clear();
  curl_multi_cleanup(_multi);
}

void HttpTransferLoop::run() {
  _thread = std::this_thread::get_id();
  for (;;) {
    HttpIntake::Orders orders = _intake.take();
    for (auto& request : orders.requests) enqueue(std::move(request));
    if (orders.stop) return fail(Whom::all, "Aborted: the HTTP client is shutting down");
    if (orders.abortBlocking && !_blockingAborted) {
      _blockingAborted = true;  // the intake lets no more of them in
      fail(Whom::blocking, "Aborted: the process is ending");
    }
    expire();
    startReady();
    int running = 0;
    if (const CURLMcode code = curl_multi_perform(_multi, &running); code != CURLM_OK) {
      recoverFrom(code);
      continue;  // the lanes that this freed start their next
    }
    if (!harvest() && _intake.mayFallAsleep()) sleep();
  }
}

void HttpTransferLoop::enqueue(std::unique_ptr<PendingHttpRequest> request) {
  assert(isOnItsThread());
  const std::shared_ptr<HttpLaneQueue> lane = request->lane;
  if (request->deadline) request->deadlineEntry = _deadlines.emplace(*request->deadline, request.get());
  _busy.emplace(lane.get(), lane);
  lane->waiting.push_back(std::move(request));
  settle(lane);
}

void HttpTransferLoop::settle(const std::shared_ptr<HttpLaneQueue>& lane) {
  assert(isOnItsThread());
  if (lane->current) return;
  if (lane->waiting.empty()) {
    _busy.erase(lane.get());
  } else if (!lane->listedReady) {
    lane->listedReady = true;
    if (lane->isLimited()) {
      _ready.push_back(lane);
    } else {
      _ready.push_front(lane);
    }
  }
}

void HttpTransferLoop::startReady() {
  assert(isOnItsThread());
  while (!_ready.empty() && (!_ready.front()->isLimited() || _limitedInFlight < kMaximumInFlight)) {
    const std::shared_ptr<HttpLaneQueue> lane = std::move(_ready.front());
    _ready.pop_front();
    lane->listedReady = false;
    if (!lane->waiting.empty()) startNext(*lane);
  }
}

void HttpTransferLoop::startNext(HttpLaneQueue& lane) {
  lane.current = std::move(lane.waiting.front());
  lane.waiting.pop_front();
  if (lane.isLimited()) ++_limitedInFlight;
  PendingHttpRequest& request = *lane.current;
  if (_spare.empty()) {
    request.transfer = CurlTransfer::create(_options);
  } else {
    request.transfer = std::move(_spare.back());
    _spare.pop_back();
  }
  if (!request.transfer || !request.transfer->begin(request.request, std::move(request.headers))) {
    return finishCurrent(lane, failure("Out of memory"));
  }
  curl_easy_setopt(request.transfer->handle(), CURLOPT_PRIVATE, &request);
  send(request);
}

void HttpTransferLoop::send(PendingHttpRequest& request) {
  const CURLMcode code = curl_multi_add_handle(_multi, request.transfer->handle());
  if (code != CURLM_OK) finishCurrent(*request.lane, failure(curl_multi_strerror(code)));
}

bool HttpTransferLoop::harvest() {
  bool any = false;
  int left = 0;
  while (const CURLMsg* message = curl_multi_info_read(_multi, &left)) {
    if (message->msg != CURLMSG_DONE) continue;
    CURL* const easy = message->easy_handle;
    const CURLcode code = message->data.result;  // gone once the handle is removed
    PendingHttpRequest* request = nullptr;
    curl_easy_getinfo(easy, CURLINFO_PRIVATE, &request);
    curl_multi_remove_handle(_multi, easy);
    transferDone(*request, code);
    any = true;
  }
  return any;
}

void HttpTransferLoop::transferDone(PendingHttpRequest& request, CURLcode code) {
  assert(isOnItsThread());
  CurlTransfer& transfer = *request.transfer;
  HttpLaneQueue& lane = *request.lane;
  if (code != CURLE_OK) return finishCurrent(lane, failure(transfer.describeFailure(code)));
  const std::string target = transfer.redirectTarget();
  const HttpRedirect redirect{request.request.method, transfer.url(),
                              transfer.status(),      target,
                              transfer.redirects(),   _options.limits.maximumRedirects};
  const RedirectVerdict verdict = judgeRedirect(redirect);
  if (verdict == RedirectVerdict::answer) return finishCurrent(lane, {transfer.takeResponse(), {}});
  if (verdict != RedirectVerdict::follow) return finishCurrent(lane, failure(describeRefusal(verdict, redirect)));
  if (!transfer.beginRedirected(target)) return finishCurrent(lane, failure("Out of memory"));
  send(request);
}

void HttpTransferLoop::expire() {
  assert(isOnItsThread());
  const Clock::time_point now = Clock::now();
  while (!_deadlines.empty() && _deadlines.begin()->first <= now) {
    PendingHttpRequest& request = *_deadlines.begin()->second;
    HttpLaneQueue& lane = *request.lane;
    const auto allowed = request.request.timeout.value_or(std::chrono::milliseconds(0)).count();
    if (lane.current.get() != &request) {
      finishWaiting(lane, request, failure(fmt::format("Timed out after {} ms, waiting for its turn", allowed)));
    } else {
      const char* const phase = request.transfer->wasConnected() ? "waiting for the answer" : "not connected";
      finishCurrent(lane, failure(fmt::format("Timed out after {} ms, {}", allowed, phase)));
    }
  }
}

void HttpTransferLoop::sleep() {
  using std::chrono::milliseconds;
  auto timeout = milliseconds(std::numeric_limits<int>::max());
  if (!_deadlines.empty()) {
    const auto left = std::chrono::ceil<milliseconds>(_deadlines.begin()->first - Clock::now());
    timeout = std::clamp(left, milliseconds(0), timeout);
  }
  const CURLMcode code = curl_multi_poll(_multi, nullptr, 0, static_cast<int>(timeout.count()), nullptr);
  if (code != CURLM_OK) recoverFrom(code);
}

// The multi handle itself failed, which leaves no transfer that can be relied on. Slowly, or a lasting failure would
// keep a processor busy.
void HttpTransferLoop::recoverFrom(CURLMcode code) {
  PLATFORM_LOG(error, "HttpClient: {}", curl_multi_strerror(code));
  fail(Whom::inFlight, curl_multi_strerror(code));
  std::this_thread::sleep_for(std::chrono::milliseconds(100));
}

void HttpTransferLoop::fail(Whom whom, const std::string& why) {
  assert(isOnItsThread());
  std::vector<std::shared_ptr<HttpLaneQueue>> lanes;  // _busy changes on the way
  lanes.reserve(_busy.size());
  for (const auto& [key, lane] : _busy) lanes.push_back(lane);
  for (const auto& lane : lanes) {
    if (lane->current && (whom != Whom::blocking || lane->current->blocking)) finishCurrent(*lane, failure(why));
    if (whom == Whom::inFlight) continue;
    std::vector<const PendingHttpRequest*> chosen;
    for (const auto& request : lane->waiting) {
      if (whom != Whom::blocking || request->blocking) chosen.push_back(request.get());
    }
    for (const PendingHttpRequest* request : chosen) finishWaiting(*lane, *request, failure(why));
  }
}

void HttpTransferLoop::finishWaiting(HttpLaneQueue& lane, const PendingHttpRequest& request, HttpResult result) {
  auto taken = lane.removeWaiting(&request);
  settle(taken->lane);
  end(std::move(taken), std::move(result));
}

void HttpTransferLoop::finishCurrent(HttpLaneQueue& lane, HttpResult result) {
  auto request = std::move(lane.current);
  if (lane.isLimited()) --_limitedInFlight;
  if (auto transfer = std::move(request->transfer)) {
    curl_multi_remove_handle(_multi, transfer->handle());
    transfer->reset();
    if (_spare.size() < kSpareTransfers) _spare.push_back(std::move(transfer));
  }
  settle(request->lane);
  end(std::move(request), std::move(result));
}

void HttpTransferLoop::end(std::unique_ptr<PendingHttpRequest> request, HttpResult result) {
  assert(isOnItsThread());
  if (request->deadline) _deadlines.erase(request->deadlineEntry);
  _intake.release(*request);
  deliver(std::move(request), std::move(result));
  _intake.ended();
}

void HttpTransferLoop::deliver(std::unique_ptr<PendingHttpRequest> request, HttpResult result) {
  if (request->observe && !request->observe(result)) return;
  if (!request->completion) return;
  if (request->blocking) return request->completion(std::move(result));
  request->lane->completions->post([completion = std::move(request->completion), result = std::move(result)]() mutable {
    completion(std::move(result));
  });
}

}  // namespace orvanta::platform
