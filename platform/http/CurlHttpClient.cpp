#include "platform/http/CurlHttpClient.h"

#include <curl/curl.h>
#include <fmt/format.h>
#include <pthread.h>

#include <algorithm>
#include <chrono>
#include <system_error>
#include <utility>

#include "platform/core/SignalMask.h"
#include "platform/http/HttpHeaderList.h"
#include "platform/http/HttpRedirect.h"

namespace orvanta::platform {

namespace {

constexpr std::chrono::milliseconds kLongestTimeout = std::chrono::hours(24 * 365);  // far from the clock's end

// Where a thread in perform() waits for its answer.
struct Awaited {
  Mutex mutex;
  Condition arrived;
  std::optional<HttpResult> result GUARDED_BY(mutex);
};

Result<void> checkSendable(const HttpRequest& request) {
  if (request.method != "GET" && request.method != "POST") return Failure{"Unsupported method " + request.method};
  if (!isHttpUrl(request.url) && !isHttpsUrl(request.url)) {
    return Failure{fmt::format("Unsupported URL \"{}\": neither http nor https", request.url)};
  }
  if (std::any_of(request.url.begin(), request.url.end(), [](unsigned char c) { return c <= 0x20 || c == 0x7f; })) {
    return Failure{"Malformed URL: it holds a blank or a control character"};
  }
  return {};
}

}  // namespace

CurlHttpClient::CurlHttpClient(WorkPool& pool, HttpClientOptions options)
    : _pool(pool), _options(std::move(options)), _intake(_options.limits) {}

CurlHttpClient::~CurlHttpClient() {
  CurlHttpClient::shutdown(std::chrono::milliseconds(0));
}

std::shared_ptr<HttpLane> CurlHttpClient::makeLane(LaneKind kind) {
  return std::make_shared<HttpLaneQueue>(kind, _pool.makeQueue());
}

void CurlHttpClient::start(const std::shared_ptr<HttpLane>& lane, HttpRequest request, Observer observe,
                           Completion completion) {
  auto pending = std::make_unique<PendingHttpRequest>();
  pending->request = std::move(request);
  pending->lane = std::static_pointer_cast<HttpLaneQueue>(lane);
  pending->observe = std::move(observe);
  pending->completion = std::move(completion);
  submit(std::move(pending));
}

HttpResult CurlHttpClient::perform(const std::shared_ptr<HttpLane>& lane, HttpRequest request) {
  Awaited awaited;
  auto pending = std::make_unique<PendingHttpRequest>();
  pending->request = std::move(request);
  pending->lane = std::static_pointer_cast<HttpLaneQueue>(lane);
  pending->blocking = true;
  pending->completion = [&awaited](HttpResult outcome) {
    const MutexLock lock(awaited.mutex);
    awaited.result = std::move(outcome);
    awaited.arrived.notifyOne();  // under the lock: once this thread goes on, none of this exists any more
  };
  submit(std::move(pending));
  const BlockingScope scope;
  MutexLock lock(awaited.mutex);
  while (!awaited.result) awaited.arrived.wait(lock);
  return std::move(*awaited.result);
}

void CurlHttpClient::submit(std::unique_ptr<PendingHttpRequest> pending) {
  const HttpRequest& request = pending->request;
  if (request.timeout) {
    pending->deadline = std::chrono::steady_clock::now() + std::min(*request.timeout, kLongestTimeout);
  }
  const Result<void> accepted = accept(pending);
  if (!accepted) HttpTransferLoop::deliver(std::move(pending), {std::nullopt, accepted.error()});
}

Result<void> CurlHttpClient::accept(std::unique_ptr<PendingHttpRequest>& pending) {
  if (auto sendable = checkSendable(pending->request); !sendable) return sendable;
  pending->headers = makeHeaderList(pending->request, false);
  if (!pending->headers) return Failure{"Out of memory"};
  if (auto running = ensureRunning(); !running) return running;
  const Result<bool> asleep = _intake.submit(pending);
  if (!asleep) return Failure{asleep.error()};
  if (*asleep) wake();
  return {};
}

Result<void> CurlHttpClient::ensureRunning() {
  if (_running.load(std::memory_order_acquire) != nullptr) return {};
  const MutexLock lock(_threadMutex);
  if (_loop || _shutDown) return {};  // after the shutdown the intake refuses
  // Takes milliseconds and megabytes, which a daemon without traffic does not need. Safe from several threads.
  if (curl_global_init(CURL_GLOBAL_DEFAULT) != CURLE_OK) return Failure{"The HTTP client cannot start"};
  auto loop = HttpTransferLoop::create(_intake, _options);
  if (!loop) return Failure{"The HTTP client cannot start"};
  try {
    const AllSignalsBlocked blocked;  // the resolver's threads, too, inherit this
    _thread = std::thread([loop = loop.get()] {
      ::pthread_setname_np(::pthread_self(), "http");
      loop->run();
    });
  } catch (const std::system_error& error) {
    return Failure{fmt::format("The HTTP client cannot start: {}", error.what())};
  }
  _loop = std::move(loop);
  _running.store(_loop.get(), std::memory_order_release);
  return {};
}

void CurlHttpClient::wake() {
  if (HttpTransferLoop* loop = _running.load(std::memory_order_acquire)) loop->wake();
}

void CurlHttpClient::abortBlockingRequests() {
  _intake.abortBlocking();
  wake();
}

void CurlHttpClient::shutdown(std::chrono::milliseconds timeout) {
  _intake.close();
  const BlockingScope scope;
  _intake.waitUntilEmpty(std::min(timeout, kLongestTimeout));
  _intake.stop();
  const MutexLock lock(_threadMutex);
  _shutDown = true;
  if (!_thread.joinable()) return;
  _loop->wake();  // only here: before, a thread that was just starting could have gone to sleep unwoken
  _thread.join();
}

std::unique_ptr<HttpClient> makeCurlHttpClient(WorkPool& pool, HttpClientOptions options) {
  return std::make_unique<CurlHttpClient>(pool, std::move(options));
}

}  // namespace orvanta::platform
