#include "platform/http/HttpIntake.h"

#include <fmt/format.h>

#include <utility>

namespace orvanta::platform {

namespace {

constexpr std::size_t kChargePerRequest = 1024;  // for headers, URL and what keeps the request together

bool fits(std::size_t charge, std::size_t used, std::size_t limit) {
  return charge <= limit && used <= limit - charge;
}

}  // namespace

Result<bool> HttpIntake::submit(std::unique_ptr<PendingHttpRequest>& request) {
  HttpLaneQueue& lane = *request->lane;
  const std::size_t charge = lane.isLimited() ? request->request.body.size() + kChargePerRequest : 0;
  const MutexLock lock(_mutex);
  if (_closed) return Failure{"The HTTP client has been shut down"};
  if (_abortBlocking && request->blocking) return Failure{"Aborted: the process is ending"};
  if (lane.isLimited() && !fits(charge, lane.charged, _limits.laneBytes)) {
    return Failure{fmt::format("Refused: {} bytes wait in this lane, {} more would exceed its limit of {}",
                               lane.charged, charge, _limits.laneBytes)};
  }
  if (lane.isLimited() && !fits(charge, _charged, _limits.totalBytes)) {
    return Failure{fmt::format("Refused: {} bytes wait in all lanes, {} more would exceed the limit of {}", _charged,
                               charge, _limits.totalBytes)};
  }
  request->charge = charge;
  lane.charged += charge;
  _charged += charge;
  ++_unfinished;
  // Behind another request of its lane it cannot start before that has ended, and then the thread is awake.
  const bool mustBeSeen = lane.unfinished++ == 0 || request->deadline.has_value();
  _submitted.push_back(std::move(request));
  return mustBeSeen && std::exchange(_asleep, false);
}

HttpIntake::Orders HttpIntake::take() {
  const MutexLock lock(_mutex);
  _asleep = false;
  return {std::exchange(_submitted, {}), _abortBlocking, _stop};
}

bool HttpIntake::mayFallAsleep() {
  const MutexLock lock(_mutex);
  _asleep = _submitted.empty();
  return _asleep;
}

void HttpIntake::release(const PendingHttpRequest& request) {
  const MutexLock lock(_mutex);
  request.lane->charged -= request.charge;
  --request.lane->unfinished;
  _charged -= request.charge;
}

void HttpIntake::ended() {
  const MutexLock lock(_mutex);
  if (--_unfinished == 0) _empty.notifyAll();
}

void HttpIntake::abortBlocking() {
  const MutexLock lock(_mutex);
  _abortBlocking = true;
}

void HttpIntake::close() {
  const MutexLock lock(_mutex);
  _closed = true;
}

bool HttpIntake::waitUntilEmpty(std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  MutexLock lock(_mutex);
  while (_unfinished > 0 && _empty.waitUntil(lock, deadline)) {
  }
  return _unfinished == 0;
}

void HttpIntake::stop() {
  const MutexLock lock(_mutex);
  _closed = true;
  _stop = true;
}

}  // namespace orvanta::platform
