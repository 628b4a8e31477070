#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "interface/Values.h"
#include "platform/core/Mutex.h"
#include "tools/collector/wire/HttpMessage.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {

// A whole answer of the HTTP library.
struct BackendAnswer {
  ResponseHead head;
  std::string body;
};

// The relays' connections to the HTTP library: one per request under way, at most kMaximum at once, a few kept open for
// the next requests. Owned by the collector. Thread-safe; callers beyond the maximum wait.
class BackendConnections {
 public:
  static constexpr std::size_t kMaximum = 16;

  explicit BackendConnections(std::uint16_t port) : _port(port) {}
  // Sends a request without a body and waits for its answer.
  Result<BackendAnswer> exchange(const std::string& head, bool answerHasBody);
  // Closes the kept connections. Called when no exchange is under way.
  void closeIdle();

 private:
  std::unique_ptr<Transport> take();
  void giveBack(std::unique_ptr<Transport> connection);
  static Result<BackendAnswer> exchangeOn(Transport& connection, const std::string& head, bool answerHasBody);

  const std::uint16_t _port;
  platform::Mutex _mutex;
  platform::Condition _givenBack;
  std::size_t _inUse GUARDED_BY(_mutex) = 0;
  std::vector<std::unique_ptr<Transport>> _idle GUARDED_BY(_mutex);
};

}  // namespace orvanta::collector
