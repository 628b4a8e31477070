#pragma once

#include <atomic>
#include <memory>
#include <thread>

#include "platform/core/Mutex.h"
#include "platform/core/Result.h"
#include "platform/http/HttpClient.h"
#include "platform/http/HttpIntake.h"
#include "platform/http/HttpTransferLoop.h"

namespace orvanta::platform {

// The HTTP client over libcurl: checks and submits requests on the callers' threads, and runs a HttpTransferLoop on a
// thread of its own. The thread starts with the first request, so that a process can enter its sandbox before.
class CurlHttpClient final : public HttpClient {
 public:
  CurlHttpClient(WorkPool& pool, HttpClientOptions options);
  ~CurlHttpClient() override;

  std::shared_ptr<HttpLane> makeLane(LaneKind kind) override;
  void start(const std::shared_ptr<HttpLane>& lane, HttpRequest request, Observer observe,
             Completion completion) override;
  HttpResult perform(const std::shared_ptr<HttpLane>& lane, HttpRequest request) override;
  void abortBlockingRequests() override;
  void shutdown(std::chrono::milliseconds timeout) override;

 private:
  // Hands the request to the HTTP thread, or delivers why that cannot be.
  void submit(std::unique_ptr<PendingHttpRequest> request);
  // Takes the request, unless it fails.
  Result<void> accept(std::unique_ptr<PendingHttpRequest>& request);
  // Fails when there is no running loop and none can be started.
  Result<void> ensureRunning();
  void wake();

  // Constant after construction.
  WorkPool& _pool;
  const HttpClientOptions _options;

  HttpIntake _intake;
  Mutex _threadMutex;                                                // for starting and joining the thread
  std::unique_ptr<HttpTransferLoop> _loop GUARDED_BY(_threadMutex);  // once made, kept until destruction
  std::thread _thread GUARDED_BY(_threadMutex);
  bool _shutDown GUARDED_BY(_threadMutex) = false;
  std::atomic<HttpTransferLoop*> _running{nullptr};  // _loop, for callers that hold no lock
};

}  // namespace orvanta::platform
