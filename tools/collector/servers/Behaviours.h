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

// A fault that the relay commits when the answer is due.
enum class ConnectionFault {
  none,
  reset,     // the connection is reset instead of an answer
  silent,    // no answer for as long as the client stays
  truncate,  // the head and the first half of the body, then the end
  corrupt,   // one bit in the middle of the body is flipped
  garbage    // bytes that are not HTTP
};
std::string_view connectionFaultText(ConnectionFault fault);
// Returns nullopt for an unknown text.
std::optional<ConnectionFault> connectionFaultFromText(std::string_view text);

// How requests to a path are treated; by default, as usual.
struct PathBehaviour {
  std::optional<int> status;        // instead of the usual answer; the body is then `body` or empty
  std::optional<std::string> body;  // instead of the usual answer's; with status 200 unless `status` says otherwise
  HeaderFields headers;             // added to the answer
  std::chrono::milliseconds delay{0};
  ConnectionFault fault = ConnectionFault::none;
  std::optional<std::size_t> times;  // the number of requests after which it ends; nullopt: when it is cleared

  bool replacesAnswer() const { return status.has_value() || body.has_value(); }
};

// The behaviours by path. A path that ends in "*" matches all paths with that prefix. An exact path takes precedence
// over the longest prefix. Owned by the collector. Thread-safe; may change at any time.
class Behaviours {
 public:
  using ByPath = std::map<std::string, PathBehaviour, std::less<>>;

  void set(const std::string& path, PathBehaviour behaviour);
  // Returns whether there was one.
  bool clear(const std::string& path);
  void clearAll();
  // Returns the behaviour for one request to the path and uses up one of its times; nullopt if no behaviour matches.
  std::optional<PathBehaviour> take(std::string_view path);
  ByPath all() const;

 private:
  mutable platform::Mutex _mutex;
  ByPath _byPath GUARDED_BY(_mutex);
};

}  // namespace orvanta::collector
