#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <vector>

#include "platform/core/Mutex.h"
#include "platform/core/Result.h"
#include "platform/http/HttpClient.h"
#include "platform/http/HttpLaneQueue.h"

namespace orvanta::platform {

// The door between callers and the HTTP thread: takes requests in their order, charges them against the limits, and
// knows when all have ended. Owned by the client. Thread-safe.
class HttpIntake {
 public:
  explicit HttpIntake(const HttpLimits& limits) : _limits(limits) {}

  // Takes the request and returns whether the HTTP thread sleeps, so that the caller has to wake it. When it fails, the
  // request stays with the caller.
  Result<bool> submit(std::unique_ptr<PendingHttpRequest>& request);

  struct Orders {
    std::vector<std::unique_ptr<PendingHttpRequest>> requests;
    bool abortBlocking = false;
    bool stop = false;  // nothing is taken in from now on
  };
  // For the HTTP thread: what came in since the last call.
  Orders take();
  // For the HTTP thread before it sleeps: false when there is something to take. While it works it is not woken, since
  // it comes back here on its own.
  bool mayFallAsleep();
  // A request's bytes no longer wait. Before its completion runs, so that this may submit the next.
  void release(const PendingHttpRequest& request);
  // A request has ended and its completion is on its way.
  void ended();

  void abortBlocking();
  // Takes nothing more in.
  void close();
  // Returns whether all that was taken in ended in time.
  bool waitUntilEmpty(std::chrono::milliseconds timeout);
  void stop();

 private:
  const HttpLimits& _limits;

  Mutex _mutex;
  Condition _empty;
  std::vector<std::unique_ptr<PendingHttpRequest>> _submitted GUARDED_BY(_mutex);
  std::size_t _charged GUARDED_BY(_mutex) = 0;     // of all limited lanes
  std::size_t _unfinished GUARDED_BY(_mutex) = 0;  // taken in and not ended
  bool _abortBlocking GUARDED_BY(_mutex) = false;
  bool _closed GUARDED_BY(_mutex) = false;
  bool _asleep GUARDED_BY(_mutex) = false;
  bool _stop GUARDED_BY(_mutex) = false;
};

}  // namespace orvanta::platform
