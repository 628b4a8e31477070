#include <functional>
#include <utility>

#include "platform/codec/Json.h"
#include "tools/collector/api/ApiRoutes.h"
#include "tools/collector/servers/SettingsReader.h"

// The URLs that change how the collector answers.

namespace orvanta::collector {

using httplib::Request;
using httplib::Response;

namespace {

constexpr std::int64_t kHighestMaxAge = 1'000'000'000;
constexpr const char* kMaxAgeOfBag = "refresh_cycle";

PropertyListForm readForm(SettingsReader& reader, const char* key, PropertyListForm otherwise, bool& wrong) {
  const auto text = reader.text(key);
  if (!text) return otherwise;
  const auto form = propertyListFormFromText(*text);
  wrong = wrong || !form;
  return form.value_or(otherwise);
}

Result<StorebagSettings> parseStorebagSettings(const Value& value) {
  SettingsReader reader(value);
  StorebagSettings settings;
  bool wrongForm = false;
  settings.container = readForm(reader, "container", settings.container, wrongForm);
  settings.bag = readForm(reader, "bag", settings.bag, wrongForm);
  settings.lastModified = reader.boolean("lastModified").value_or(settings.lastModified);
  const Value* maxAge = reader.take("maxAge");
  settings.maxAgeOfBag = maxAge == nullptr || *maxAge == kMaxAgeOfBag;
  if (maxAge != nullptr && maxAge->isNull()) {
    settings.maxAge = std::nullopt;
  } else if (!settings.maxAgeOfBag) {
    settings.maxAge = reader.integer("maxAge", -kHighestMaxAge, kHighestMaxAge);
  }
  if (auto failure = reader.finish()) return std::move(*failure);
  if (wrongForm) return Failure{"\"container\" and \"bag\" are \"xml\" or \"binary\""};
  return settings;
}

Dictionary describe(const StorebagSettings& settings) {
  return Dictionary{{"container", std::string(propertyListFormText(settings.container))},
                    {"bag", std::string(propertyListFormText(settings.bag))},
                    {"lastModified", settings.lastModified},
                    {"maxAge", settings.maxAgeOfBag ? Value(kMaxAgeOfBag)
                               : settings.maxAge    ? Value(*settings.maxAge)
                                                    : Value()}};
}

void answerState(Response& response, const ApiContext& context) {
  answerJson(response, Dictionary{{"paths", context.behaviours.describe()},
                                  {"acknowledgements", describe(context.dashboard.settings())},
                                  {"storebag", describe(context.storebags.settings())}});
}

// Parses the body with `parse` and hands the settings to `apply`; answers with the new state, or with what was wrong.
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
  // What is left below /control is no event post.
  server.Post(R"(/control(/.*)?)",
              [](const Request&, Response& response) { answerError(response, 404, "no such knob"); });
}

}  // namespace orvanta::collector
