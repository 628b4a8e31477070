#pragma once

#include <chrono>
#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/core/Mutex.h"
#include "tools/collector/wire/HttpMessage.h"

namespace orvanta::collector {

// What the relay does to the connection when the answer is due.
enum class ConnectionFault {
  none,
  reset,     // the connection is reset instead of an answer
  silent,    // no answer for as long as the client stays
  truncate,  // the head and the first half of the body, then the end
  corrupt,   // one bit in the middle of the body is flipped
  garbage    // bytes that are no HTTP
};
std::string_view connectionFaultText(ConnectionFault fault);
std::optional<ConnectionFault> connectionFaultFromText(std::string_view text);

// How requests to a path are treated instead of the usual.
struct PathBehaviour {
  std::optional<int> status;        // instead of the usual answer; the body is then `body` or empty
  std::optional<std::string> body;  // instead of the usual answer's; with status 200 unless `status` says otherwise
  HeaderFields headers;             // added to the answer
  std::chrono::milliseconds delay{0};
  ConnectionFault fault = ConnectionFault::none;
  std::optional<std::size_t> times;  // for so many requests, after which the behaviour is gone; none: until cleared

  bool replacesAnswer() const { return status.has_value() || body.has_value(); }
};

// The behaviours by path, changed at any time. A path ending in "*" stands for all that begin with what precedes it;
// the exact path goes before the longest such beginning. Thread-safe.
class Behaviours {
 public:
  using ByPath = std::map<std::string, PathBehaviour, std::less<>>;

  void set(const std::string& path, PathBehaviour behaviour);
  // Whether there was one.
  bool clear(const std::string& path);
  void clearAll();
  // The behaviour for one request to the path, which uses up one of its times.
  std::optional<PathBehaviour> take(std::string_view path);
  ByPath all() const;

 private:
  mutable platform::Mutex _mutex;
  ByPath _byPath GUARDED_BY(_mutex);
};

}  // namespace orvanta::collector
