#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/core/Text.h"
#include "platform/core/UniqueFunction.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

struct HttpHeader {
  std::string name;
  std::string value;
};

struct HttpRequest {
  std::string method = "GET";       // or "POST"
  std::string url;                  // http or https
  std::vector<HttpHeader> headers;  // sent in this order; see HttpClient
  std::string body;
  // From submission to the whole answer, waiting in the lane included; without it, only the progress rule applies.
  std::optional<std::chrono::milliseconds> timeout;
  // The answer's body is read and thrown away.
  bool discardResponseBody = false;
};

struct HttpResponse {
  int status = 0;
  std::vector<HttpHeader> headers;  // of the last answer, after redirects
  std::string body;
  // The first header of that name, compared without case; null when absent.
  const std::string* header(std::string_view name) const {
    for (const HttpHeader& header : headers) {
      if (equalsIgnoringCase(header.name, name)) return &header.value;
    }
    return nullptr;
  }
};

// A request's outcome: an answer, or a transport error's text (which carries the TLS library's reason), never both.
struct HttpResult {
  std::optional<HttpResponse> response;
  std::string error;
};

// Requests of one lane start in the order in which they were submitted, each when the one before has ended. Made by the
// client; dropping the last reference lets requests already submitted run on.
class HttpLane {
 public:
  virtual ~HttpLane() = default;
};

struct HttpLimits {
  std::size_t laneBytes = 16U << 20U;   // waiting in one lane, each request charged its body plus 1 KiB
  std::size_t totalBytes = 64U << 20U;  // waiting in all lanes
  std::size_t responseBytes = 16U << 20U;
  std::chrono::seconds noProgress{60};
  int maximumRedirects = 5;
};

// The process's HTTP client, on one thread of its own that only moves bytes.
//
// http and https only; certificates and host names are verified; no "Expect" header, and none but Host that the caller
// did not ask for (Accept, User-Agent and Content-Length only as given, or as HTTP needs them); a header whose value
// holds control characters is left out with a warning, an empty value is sent empty. Redirects: at most 5; a POST is
// repeated only on 307 and 308, and on other redirects the redirect itself is the answer; never from https to http.
// Answers above 16 MiB fail. A request that does not fit a lane's or the client's limit fails at once with a transport
// error that says so.
//
// Every call may come from any thread. Each completion runs exactly once, unless its observer makes it needless.
class HttpClient {
 public:
  // Unrefused: requests of the lane are exempt from the limits on waiting bytes.
  enum class LaneKind { limited, unrefused };

  using Completion = UniqueFunction<void(HttpResult)>;

  virtual ~HttpClient() = default;
  virtual std::shared_ptr<HttpLane> makeLane(LaneKind kind = LaneKind::limited) = 0;

  // Sees the result first, on the client's own thread (or the caller's when the request is refused at once): it must
  // not block, lock for long or call the client. Returns whether the completion is still wanted; if not, it is dropped.
  using Observer = UniqueFunction<bool(const HttpResult&)>;

  // Submits the request and returns. `observe` may be empty. `completion` runs on the pool afterwards.
  virtual void start(const std::shared_ptr<HttpLane>& lane, HttpRequest request, Observer observe,
                     Completion completion) = 0;

  // Submits the request and waits, in a BlockingScope, for its end.
  virtual HttpResult perform(const std::shared_ptr<HttpLane>& lane, HttpRequest request) = 0;

  // Ends every request that a thread waits for in perform(), now and later, with a transport error. For shutting down.
  virtual void abortBlockingRequests() = 0;
  // Waits up to `timeout` for all submitted requests to end, then fails the rest and joins the thread. Completions of
  // failed requests still run on the pool. Requests submitted later fail at once. Idempotent.
  virtual void shutdown(std::chrono::milliseconds timeout) = 0;
};

struct HttpClientOptions {
  std::string caFile;  // PEM certificates trusted instead of the system's; empty: the system's
  HttpLimits limits;
};

// The client over libcurl's multi interface. The pool outlives it.
std::unique_ptr<HttpClient> makeCurlHttpClient(WorkPool& pool, HttpClientOptions options);

}  // namespace orvanta::platform
