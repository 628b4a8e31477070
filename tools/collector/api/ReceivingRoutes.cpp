#include <fmt/format.h>
#include <httplib.h>

#include <utility>

#include "tools/collector/api/ApiServer.h"

// The URLs for daemons: storebags, posts of events, log data, uploads.

namespace orvanta::collector {

using httplib::Request;
using httplib::Response;

namespace {

void answerStorebag(const Request& request, Response& response, const ApiContext& context) {
  const auto received = requestOf(request, response, context);
  if (!received) return;
  HttpAnswer answer = context.storebags.answer(request.matches[1], received->header("If-Modified-Since"));
  response.status = answer.status;
  for (const auto& [name, value] : answer.headers) response.set_header(name, value);
  if (!answer.body.empty()) response.set_content(answer.body, answer.contentType);
}

void answerEvents(const Request& request, Response& response, const ApiContext& context) {
  const auto received = requestOf(request, response, context);
  if (!received) return;
  if (!received->damage.empty()) return answerError(response, 400, received->damage);
  const Array& events = *received->json->dictionary()->array("events");
  answerJson(response, Dictionary{{"accepted", static_cast<std::int64_t>(events.size())}});
}

void answerLogData(const Request& request, Response& response, const ApiContext& context) {
  const auto received = requestOf(request, response, context);
  if (!received) return;
  response.set_content(fmt::format("{}/logdata/{}", context.baseURL(), received->exchange), "text/plain");
}

void answerUpload(const Request& request, Response& response, const ApiContext& context) {
  const auto received = requestOf(request, response, context);
  if (!received) return;
  if (!received->damage.empty()) return answerError(response, 400, received->damage);
  response.set_content("success\n", "text/plain");
}

}  // namespace

void addReceivingRoutes(httplib::Server& server, const ApiContext& context) {
  const auto route = [&context](void (*handler)(const Request&, Response&, const ApiContext&)) {
    return [&context, handler](const Request& request, Response& response) { handler(request, response, context); };
  };
  server.Get(R"(/storebags/([^/]+))", route(answerStorebag));
  server.Post(R"(/logdata(/.*)?)", route(answerLogData));
  server.Post(R"(/upload(/.*)?)", route(answerUpload));
  server.Post(R"(/.*)", route(answerEvents));
}

}  // namespace orvanta::collector
