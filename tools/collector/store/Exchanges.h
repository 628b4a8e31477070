#pragma once

#include <cstdint>
#include <map>
#include <memory>

#include "platform/core/Mutex.h"
#include "tools/collector/store/ReceivedRecords.h"

namespace orvanta::collector {

// The requests that the relay has read and the HTTP library is answering. The relay passes the library the head alone,
// with the number of the exchange; the library's handlers find the whole request here, with its body as it was on the
// wire. Owned by the collector. Thread-safe.
class Exchanges {
 public:
  // The header that carries the number from the relay to the handlers.
  static constexpr const char* kHeader = "X-Collector-Exchange";

  void begin(std::shared_ptr<const ReceivedRequest> request) {
    const platform::MutexLock lock(_mutex);
    _open[request->exchange] = std::move(request);
  }
  void end(std::int64_t exchange) {
    const platform::MutexLock lock(_mutex);
    _open.erase(exchange);
  }
  // Returns null if there is no such exchange.
  std::shared_ptr<const ReceivedRequest> find(std::int64_t exchange) const {
    const platform::MutexLock lock(_mutex);
    const auto found = _open.find(exchange);
    return found != _open.end() ? found->second : nullptr;
  }

 private:
  mutable platform::Mutex _mutex;
  std::map<std::int64_t, std::shared_ptr<const ReceivedRequest>> _open GUARDED_BY(_mutex);
};

}  // namespace orvanta::collector
