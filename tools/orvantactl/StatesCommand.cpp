#include <memory>
#include <optional>
#include <utility>

#include "platform/codec/Json.h"
#include "tools/orvantactl/Commands.h"
#include "tools/orvantactl/ConfiguredSession.h"
#include "tools/orvantactl/Output.h"

namespace orvanta::ctl {

namespace {

int showStates(const ClientOptions& options) {
  int status = kAllTaken;
  const auto session = configureOrComplain(options, status);
  if (!session.backends) return status;
  Array names(session.backends->begin(), session.backends->end());
  printLine(platform::writeJson(Dictionary{{"backends", std::move(names)}}));
  return kAllTaken;
}

int showDisplayURL(const ClientOptions& options) {
  int status = kAllTaken;
  const auto session = configureOrComplain(options, status);
  if (!session.backends) return status;
  const auto url = session.connection->session().blocking().fetchDisplayURL();
  if (!url) return complain(url.error());
  if (!*url || **url == "URL not available") {
    complain("no backend of this client type has a display URL (\"display_url\" in its storebag)");
    return kSomethingNotTaken;
  }
  printLine(**url);
  return kAllTaken;
}

}  // namespace

void addStatesCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<ClientOptions>();
  auto& command = *app.add_subcommand("states", "Shows which backends report, or hold events, for such a session");
  command.footer(
      "Writes {\"backends\":[…]}: those enabled and those sampled out, which hold events until one promotes.");
  options->addTo(command);
  command.callback([options, &status] { status = showStates(*options); });
}

void addDisplayURLCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<ClientOptions>();
  auto& command = *app.add_subcommand("display-url", "Shows the URL at which a session's reports can be looked at");
  options->addTo(command);
  command.callback([options, &status] { status = showDisplayURL(*options); });
}

}  // namespace orvanta::ctl
