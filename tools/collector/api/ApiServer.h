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

// What the URLs read and change. Each part is thread-safe and outlives the server.
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
// Listens on the loopback on a port that only the relay knows. Handlers run on a pool of threads of its own.
class ApiServer {
 public:
  static Result<std::unique_ptr<ApiServer>> start(ApiContext context);
  virtual ~ApiServer() = default;
  virtual std::uint16_t port() const = 0;
};

}  // namespace orvanta::collector
