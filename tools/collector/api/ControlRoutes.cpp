#include <httplib.h>

#include <functional>
#include <utility>

#include "platform/codec/Json.h"
#include "tools/collector/api/ApiServer.h"
#include "tools/collector/api/ControlSettings.h"

// The URLs that change how the collector answers.

namespace orvanta::collector {

using httplib::Request;
using httplib::Response;

namespace {

void answerState(Response& response, const ApiContext& context) {
  Dictionary paths;
  for (const auto& [path, behaviour] : context.behaviours.all()) paths.set(path, describe(behaviour));
  answerJson(response, Dictionary{{"paths", std::move(paths)},
                                  {"acknowledgements", describe(context.dashboard.settings())},
                                  {"storebag", describe(context.storebags.settings())}});
}

// Parses the body with `parse` and passes the settings to `apply`; answers with the new state, or 400 with the reason.
template <class Settings>
httplib::Server::Handler settingsHandler(const ApiContext& context, Result<Settings> (*parse)(const Value&),
                                         std::function<void(Settings)> apply) {
  return [&context, parse, apply = std::move(apply)](const Request& request, Response& response) {
    const auto received = requestOf(request, response, context);
    if (!received) return;
    const auto json = platform::parseJson(received->body);
    if (!json) return answerError(response, 400, json.error());
    auto settings = parse(json.value());
    if (!settings) return answerError(response, 400, settings.error());
    apply(std::move(settings.value()));
    answerState(response, context);
  };
}

void putBag(const Request& request, Response& response, const ApiContext& context) {
  const auto received = requestOf(request, response, context);
  if (!received) return;
  const std::string& body = received->body;
  auto bag = parseBagSource({reinterpret_cast<const std::uint8_t*>(body.data()), body.size()});
  if (!bag) return answerError(response, 400, bag.error());
  context.storebags.setBag(request.get_param_value("name"), std::move(bag.value()));
  response.status = 204;
}

}  // namespace

void addControlRoutes(httplib::Server& server, const ApiContext& context) {
  server.Get("/control", [&context](const Request&, Response& response) { answerState(response, context); });
  server.Post("/control/paths",
              settingsHandler<PathSetting>(context, parsePathSetting, [&context](PathSetting setting) {
                context.behaviours.set(setting.path, std::move(setting.behaviour));
              }));
  server.Delete("/control/paths", [&context](const Request& request, Response& response) {
    if (!request.has_param("path")) {
      context.behaviours.clearAll();
    } else if (!context.behaviours.clear(request.get_param_value("path"))) {
      return answerError(response, 404, "that path has no behaviour of its own");
    }
    answerState(response, context);
  });
  server.Post("/control/acknowledgements",
              settingsHandler<AcknowledgementSettings>(
                  context, parseAcknowledgementSettings,
                  [&context](const AcknowledgementSettings& settings) { context.dashboard.setSettings(settings); }));
  server.Post("/control/storebag", settingsHandler<StorebagSettings>(context, parseStorebagSettings,
                                                                     [&context](const StorebagSettings& settings) {
                                                                       context.storebags.setSettings(settings);
                                                                     }));
  server.Put("/control/bag",
             [&context](const Request& request, Response& response) { putBag(request, response, context); });
  server.Delete("/control/bag", [&context](const Request&, Response& response) {
    context.storebags.clearBags();
    response.status = 204;
  });
  // Without this, posts to misspelt URLs below /control would be taken for events.
  server.Post(R"(/control(/.*)?)",
              [](const Request&, Response& response) { answerError(response, 404, "no such URL below /control"); });
}

}  // namespace orvanta::collector
