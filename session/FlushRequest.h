#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "backends/OrvantaBackend.h"
#include "interface/ClientSessionInterface.h"
#include "platform/core/Mutex.h"
#include "session/DaemonServices.h"

namespace orvanta {

// The bookkeeping of one flush: how many backends are still to finish, and the client's completion until it has been
// called. The first error of any backend, or else the last backend's result, reaches the client; everything later only
// counts.
//
// Shared by the completions of the backends, which may run on any thread. Keeps no session alive.
class FlushRequest : public std::enable_shared_from_this<FlushRequest> {
 public:
  FlushRequest(DaemonServices& services, std::int32_t backendCount, FlushReply completion);

  // The completion for one backend.
  FlushCompletion completionFor(std::string backendName);

 private:
  void finished(const std::string& backendName, std::optional<std::string> result, std::optional<OrvantaError> error);

  Platform& _platform;
  const std::shared_ptr<platform::Mutex> _lock;  // DaemonServices::flushLock
  std::int32_t _pending GUARDED_BY(*_lock);
  FlushReply _completion GUARDED_BY(*_lock);  // empty once called
};

}  // namespace orvanta
