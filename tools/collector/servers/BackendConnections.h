#pragma once

#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "interface/Values.h"
#include "tools/collector/wire/HttpMessage.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {

// A whole answer of the HTTP library.
struct BackendAnswer {
  ResponseHead head;
  std::string body;
};

// The relay's connections to the HTTP library: one per request under way, at most kMaximum at once, a few kept for the
// next. Thread-safe; callers beyond the maximum wait.
class BackendConnections {
 public:
  static constexpr std::size_t kMaximum = 16;

  explicit BackendConnections(std::uint16_t port) : _port(port) {}
  // Sends a request without a body and waits for its answer.
  Result<BackendAnswer> exchange(const std::string& head, bool answerHasBody);
  // Closes those kept. Called when no exchange is under way.
  void closeIdle();

 private:
  std::unique_ptr<Transport> take();
  void giveBack(std::unique_ptr<Transport> connection);
  static Result<BackendAnswer> exchangeOn(Transport& connection, const std::string& head, bool answerHasBody);

  const std::uint16_t _port;
  std::mutex _mutex;
  std::condition_variable _condition;
  std::size_t _inUse = 0;                         // guarded by _mutex
  std::vector<std::unique_ptr<Transport>> _idle;  // guarded by _mutex
};

}  // namespace orvanta::collector
