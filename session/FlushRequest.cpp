#include "session/FlushRequest.h"

#include <fmt/format.h>

#include "config/MessageLog.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {

FlushRequest::FlushRequest(DaemonServices& services, std::int32_t backendCount, FlushReply completion)
    : _platform(services.platform),
      _lock(services.flushLock),
      _pending(backendCount),
      _completion(std::move(completion)) {}

FlushCompletion FlushRequest::completionFor(std::string backendName) {
  return [self = shared_from_this(), name = std::move(backendName)](std::optional<std::string> result,
                                                                    std::optional<OrvantaError> error) {
    self->finished(name, std::move(result), std::move(error));
  };
}

void FlushRequest::finished(const std::string& backendName, std::optional<std::string> result,
                            std::optional<OrvantaError> error) {
  ORVANTA_LOG(debug, "internalFlushMessagesWithCompletion: {}", backendName);
  if (result) writeToLogFile(_platform, fmt::format("[{} -> flushMessages] {}", backendName, *result));

  FlushReply completion;
  {
    const platform::MutexLock lock(*_lock);
    --_pending;
    if (!_completion || (!error && _pending > 0)) return;
    completion = std::move(_completion);
  }
  completion(std::move(result), std::move(error));
}

}  // namespace orvanta
