#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "interface/Values.h"
#include "tools/collector/servers/Behaviours.h"
#include "tools/collector/servers/DashboardServer.h"
#include "tools/collector/servers/StorebagServer.h"
#include "tools/collector/store/Exchanges.h"
#include "tools/collector/store/Inbox.h"

namespace orvanta::collector {

// The parts that the URLs read and change. Each is thread-safe and outlives the server.
struct ApiContext {
  Inbox& inbox;
  Exchanges& exchanges;
  Behaviours& behaviours;
  StorebagServer& storebags;
  DashboardServer& dashboard;
  std::function<std::string()> baseURL;  // http://127.0.0.1:PORT
  std::string caFile;
};

// The HTTP library behind the relay, with every URL of the collector: storebags, posts, uploads, listings, control.
// Owned by the collector. Listens on the loopback, on a port that only the relay knows, from start() until it is
// destroyed. Handlers run on the library's pool of threads, several at a time; a failed one is answered 4xx or 5xx.
class ApiServer {
 public:
  static Result<std::unique_ptr<ApiServer>> start(ApiContext context);
  virtual ~ApiServer() = default;
  virtual std::uint16_t port() const = 0;
};

}  // namespace orvanta::collector
