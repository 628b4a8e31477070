#pragma once

#include <httplib.h>

#include <memory>
#include <string>

#include "interface/Values.h"
#include "tools/collector/api/ApiServer.h"

namespace orvanta::collector {

// The routes, by what they are for. Of two that match, the one added first is taken.
void addListingRoutes(httplib::Server& server, const ApiContext& context);
void addControlRoutes(httplib::Server& server, const ApiContext& context);
void addReceivingRoutes(httplib::Server& server, const ApiContext& context);

// The request as the relay read it; null (and an answer that says so) for one that did not come through the relay.
std::shared_ptr<const ReceivedRequest> requestOf(const httplib::Request& request, httplib::Response& response,
                                                 const ApiContext& context);
void answerJson(httplib::Response& response, const Value& value, int status = 200);
void answerError(httplib::Response& response, int status, const std::string& reason);

}  // namespace orvanta::collector
