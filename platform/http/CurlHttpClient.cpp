#include "platform/http/CurlHttpClient.h"

#include <curl/curl.h>
#include <fmt/format.h>
#include <pthread.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <csignal>
#include <system_error>
#include <utility>

#include "platform/http/HttpHeaderList.h"
#include "platform/http/HttpRedirect.h"

namespace orvanta::platform {

namespace {

constexpr std::chrono::milliseconds kLongestTimeout = std::chrono::hours(24 * 365);  // far from the clock's end

// Signals are for the process's other threads; the resolver's threads, too, inherit this.
class SignalsBlocked {
 public:
  SignalsBlocked() {
    sigset_t all;
    ::sigfillset(&all);
    ::pthread_sigmask(SIG_SETMASK, &all, &_before);
  }
  ~SignalsBlocked() { ::pthread_sigmask(SIG_SETMASK, &_before, nullptr); }
  SignalsBlocked(const SignalsBlocked&) = delete;
  SignalsBlocked& operator=(const SignalsBlocked&) = delete;

 private:
  sigset_t _before{};
};

std::optional<std::string> whyUnsendable(const HttpRequest& request) {
  if (request.method != "GET" && request.method != "POST") return "Unsupported method " + request.method;
  if (!isHttpUrl(request.url) && !isHttpsUrl(request.url)) {
    return fmt::format("Unsupported URL \"{}\": neither http nor https", request.url);
  }
  if (std::any_of(request.url.begin(), request.url.end(), [](unsigned char c) { return c <= 0x20 || c == 0x7f; })) {
    return "Malformed URL: it holds a blank or a control character";
  }
  return std::nullopt;
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
  handIn(std::move(pending));
}

HttpResult CurlHttpClient::perform(const std::shared_ptr<HttpLane>& lane, HttpRequest request) {
  std::mutex mutex;
  std::condition_variable arrived;
  std::optional<HttpResult> result;  // guarded by mutex
  auto pending = std::make_unique<PendingHttpRequest>();
  pending->request = std::move(request);
  pending->lane = std::static_pointer_cast<HttpLaneQueue>(lane);
  pending->blocking = true;
  pending->completion = [&](HttpResult outcome) {
    const std::lock_guard guard(mutex);
    result = std::move(outcome);
    arrived.notify_one();  // under the lock: once this thread goes on, none of this is there any more
  };
  handIn(std::move(pending));
  const BlockingScope scope;
  std::unique_lock lock(mutex);
  arrived.wait(lock, [&] { return result.has_value(); });
  return std::move(*result);
}

void CurlHttpClient::handIn(std::unique_ptr<PendingHttpRequest> pending) {
  const HttpRequest& request = pending->request;
  if (request.timeout) {
    pending->deadline = std::chrono::steady_clock::now() + std::min(*request.timeout, kLongestTimeout);
  }
  std::optional<std::string> refusal = whyUnsendable(request);
  if (!refusal) {
    pending->headers = makeHeaderList(request, false);
    refusal = pending->headers ? ensureRunning() : "Out of memory";
  }
  if (!refusal) {
    HttpIntake::Entry entry = _intake.handIn(pending);
    if (entry.wake) wake();
    refusal = std::move(entry.refusal);
  }
  if (refusal) HttpTransferLoop::deliver(std::move(pending), {std::nullopt, std::move(*refusal)});
}

std::optional<std::string> CurlHttpClient::ensureRunning() {
  if (_running.load(std::memory_order_acquire) != nullptr) return std::nullopt;
  const std::lock_guard guard(_threadMutex);
  if (_loop || _shutDown) return std::nullopt;  // after the shutdown the intake has the word
  // Takes milliseconds and megabytes, which a daemon without traffic does not need. Safe from several threads.
  if (curl_global_init(CURL_GLOBAL_DEFAULT) != CURLE_OK) return "The HTTP client cannot start";
  auto loop = HttpTransferLoop::create(_intake, _options);
  if (!loop) return "The HTTP client cannot start";
  try {
    const SignalsBlocked blocked;
    _thread = std::thread([loop = loop.get()] {
      ::pthread_setname_np(::pthread_self(), "http");
      loop->run();
    });
  } catch (const std::system_error& error) {
    return fmt::format("The HTTP client cannot start: {}", error.what());
  }
  _loop = std::move(loop);
  _running.store(_loop.get(), std::memory_order_release);
  return std::nullopt;
}

void CurlHttpClient::wake() {
  if (HttpTransferLoop* loop = _running.load(std::memory_order_acquire)) loop->wake();
}

void CurlHttpClient::abortBlockingRequests() {
  _intake.abortBlocking();
  wake();
}

void CurlHttpClient::shutdown(std::chrono::milliseconds patience) {
  _intake.close();
  const BlockingScope scope;
  _intake.waitUntilEmpty(std::min(patience, kLongestTimeout));
  _intake.stop();
  const std::lock_guard guard(_threadMutex);
  _shutDown = true;
  if (!_thread.joinable()) return;
  _loop->wake();  // only here: before, a thread that was just starting could have gone to sleep unwoken
  _thread.join();
}

std::unique_ptr<HttpClient> makeCurlHttpClient(WorkPool& pool, HttpClientOptions options) {
  return std::make_unique<CurlHttpClient>(pool, std::move(options));
}

}  // namespace orvanta::platform
