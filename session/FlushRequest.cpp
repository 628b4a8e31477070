#include "session/FlushRequest.h"

#include <fmt/format.h>

#include "config/MessageLog.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {

namespace {
// Shared with the requests, since the last completions may run when the platform is already going.
struct FlushLock {
  std::shared_ptr<std::mutex> mutex = std::make_shared<std::mutex>();
};
}  // namespace

FlushRequest::FlushRequest(Platform& platform, std::int32_t backendCount, FlushReply completion)
    : _platform(platform),
      _lock(platform.once<FlushLock>([] { return FlushLock{}; }).mutex),
      _pending(backendCount),
      _completion(std::move(completion)) {}

FlushCompletion FlushRequest::completionFor(std::string key, std::string backendName) {
  return [self = shared_from_this(), key = std::move(key), name = std::move(backendName)](
             std::optional<std::string> result, std::optional<OrvantaError> error) {
    self->finished(key, name, std::move(result), std::move(error));
  };
}

void FlushRequest::finished(const std::string& key, const std::string& backendName, std::optional<std::string> result,
                            std::optional<OrvantaError> error) {
  ORVANTA_LOG(debug, "internalFlushMessagesWithCompletion: {}", backendName);
  if (result) writeToLogFile(_platform, fmt::format("[{} -> flushMessages] {}", key, *result));

  FlushReply completion;
  {
    const std::lock_guard lock(*_lock);
    --_pending;
    if (!_completion || (!error && _pending > 0)) return;
    completion = std::move(_completion);
  }
  completion(std::move(result), std::move(error));
}

}  // namespace orvanta
