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

namespace httplib {
class Server;
struct Request;
struct Response;
}  // namespace httplib

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

// --- For the files that add the routes ---

// Adds the routes of one purpose each. Of two routes that match a request, the library takes the one added first, so
// that ReceivingRoutes, which takes posts to any path, goes last. `context` outlives the server.
void addListingRoutes(httplib::Server& server, const ApiContext& context);
void addControlRoutes(httplib::Server& server, const ApiContext& context);
void addReceivingRoutes(httplib::Server& server, const ApiContext& context);

// Returns the request as the relay read it. Returns null, and answers 403, if it did not come through the relay.
std::shared_ptr<const ReceivedRequest> requestOf(const httplib::Request& request, httplib::Response& response,
                                                 const ApiContext& context);
void answerJson(httplib::Response& response, const Value& value, int status = 200);
void answerError(httplib::Response& response, int status, const std::string& reason);

}  // namespace orvanta::collector
