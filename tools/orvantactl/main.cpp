#include <CLI/CLI.hpp>

#include "platform/host/Process.h"
#include "tools/orvantactl/Commands.h"
#include "tools/orvantactl/Output.h"

namespace {

constexpr const char* kDescription =
    "Speaks to orvantad as a client does: reports events, uploads files, watches the events of others, and edits the "
    "daemon's user defaults.";

constexpr const char* kFooter =
    "First steps:\n"
    "  echo '{\"category\": 1, \"type\": 2, \"payload\": {\"duration\": 1.5}}' | orvantactl session --client-type 7\n"
    "  orvantactl send --client-type 7 --category 1 --type 2 --payload '{\"duration\": 1.5}'\n"
    "  orvantactl COMMAND --help\n"
    "\n"
    "Exit status: 0 the daemon took everything, 1 something was not taken or there is no answer to show,\n"
    "2 the command line is invalid, 3 the daemon does not run or refused this user, 4 the daemon took\n"
    "everything, but standard output did not take all answers.";

}  // namespace

int main(int argc, char** argv) {
  orvanta::platform::secureStandardDescriptors();
  CLI::App app(kDescription, "orvantactl");
  app.footer(kFooter);
  app.require_subcommand(1);
  int status = orvanta::ctl::kAllTaken;
  orvanta::ctl::addSessionCommand(app, status);
  orvanta::ctl::addSendCommand(app, status);
  orvanta::ctl::addStatesCommand(app, status);
  orvanta::ctl::addDisplayURLCommand(app, status);
  orvanta::ctl::addWatchCommand(app, status);
  orvanta::ctl::addUploadCommand(app, status);
  orvanta::ctl::addUploadLogCommand(app, status);
  orvanta::ctl::addDefaultsCommand(app, status);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    status = app.exit(error) == 0 ? orvanta::ctl::kAllTaken : orvanta::ctl::kUsage;
  }
  return orvanta::ctl::statusAfterOutput(status);
}
