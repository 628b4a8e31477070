#pragma once

#include <memory>

#include "platform/queue/WorkQueue.h"

namespace orvanta {

// Keeps the service manager's status text at the number of sessions. Told a little later than it changes, and then only
// the last number: clients that come and go must not keep the service manager busy. Owned by the agent; any thread.
class SessionCountStatus {
 public:
  explicit SessionCountStatus(platform::WorkPool& pool);

  void changed(std::size_t count);

 private:
  struct State;
  const std::shared_ptr<State> _state;  // shared with what waits on the queue
};

}  // namespace orvanta
