#pragma once

#include <httplib.h>

#include <memory>
#include <string>

#include "interface/Values.h"
#include "tools/collector/api/ApiServer.h"

namespace orvanta::collector {

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
