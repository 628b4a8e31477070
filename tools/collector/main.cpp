#include <fmt/format.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <optional>
#include <string>

#include "platform/codec/Json.h"
#include "platform/core/Text.h"
#include "platform/host/Process.h"
#include "tools/collector/Collector.h"

// Runs a collector until SIGTERM or SIGINT. Prints one line of JSON as soon as it listens.

namespace {

using namespace orvanta;

std::string defaultDirectory() {
  const char* state = std::getenv("XDG_STATE_HOME");
  const char* home = std::getenv("HOME");
  if (state != nullptr && *state == '/') return std::string(state) + "/orvanta-collector";
  return std::string(home != nullptr ? home : ".") + "/.local/state/orvanta-collector";
}

// Does not throw: the collector goes on receiving when standard error is closed or full.
void tell(const std::string& line) {
  std::fputs((line + "\n").c_str(), stderr);
}

// Returns the exit status.
int fail(const std::string& text) {
  tell("orvanta-collector: " + text);
  return 1;
}

void printRequest(const collector::ReceivedRequest& request) {
  tell(fmt::format("{:.3f} {} {} {} {} {} bytes{}", request.time, request.client, request.method, request.target,
                   request.status, request.rawBody.size(), request.note.empty() ? "" : " (" + request.note + ")"));
}

Result<void> printReady(const collector::Collector& running) {
  const Dictionary ready{{"pid", static_cast<std::int64_t>(::getpid())},
                         {"directory", running.directory()},
                         {"http", running.httpURL()},
                         {"https", running.httpsURL()},
                         {"httpPort", int{running.httpPort()}},
                         {"httpsPort", int{running.httpsPort()}},
                         {"dashboardPort", int{running.dashboardPort()}},
                         {"storebagURL", running.storebagURL()},
                         {"eventsURL", running.eventsURL()},
                         {"uploadURL", running.httpsURL("/upload")},
                         {"logDataURL", running.httpsURL("/logdata")},
                         {"caFile", running.caFile()},
                         {"publicKeyFile", running.publicKeyFile()},
                         {"databaseFile", running.databaseFile()}};
  if (std::fputs((platform::writeJson(ready) + "\n").c_str(), stdout) < 0 || std::fflush(stdout) != 0) {
    return Failure{"cannot write to standard output: " + platform::errnoText(errno)};
  }
  return {};
}

}  // namespace

int main(int argc, char** argv) {
  platform::secureStandardDescriptors();
  collector::CollectorOptions options;
  options.directory = defaultDirectory();
  options.httpPort = 8480;
  options.httpsPort = 8443;
  options.dashboardPort = 8481;
  bool anyPorts = false;
  bool quiet = false;
  std::string container = "xml";
  std::string bag = "xml";
  std::optional<std::int64_t> maxAge;

  CLI::App app(
      "Plays every server that orvantad talks to, on this machine, and records what they receive.\n"
      "Prints its addresses and files as a line of JSON, then a line per request on standard error.",
      "orvanta-collector");
  app.footer("How to read its records and to inject faults: man orvanta-collector, docs/collector.md");
  app.add_option("-d,--directory", options.directory,
                 "for keys, certificates, storebags and records; created if missing")
      ->capture_default_str();
  app.add_option("--address", options.address, "IPv4 address to listen on")->capture_default_str();
  app.add_option("--http-port", options.httpPort, "TCP; 0 takes any free port")->capture_default_str();
  app.add_option("--https-port", options.httpsPort, "TCP; 0 takes any free port")->capture_default_str();
  app.add_option("--dashboard-port", options.dashboardPort, "UDP; 0 takes any free port")->capture_default_str();
  app.add_flag("--any-ports", anyPorts, "take three free ports");
  app.add_option("--max-age", maxAge, "seconds for which daemons keep a storebag (default: the bag's refresh_cycle)");
  app.add_option("--container", container, "form of the signed document")
      ->capture_default_str()
      ->check(CLI::IsMember({"xml", "binary"}));
  app.add_option("--bag", bag, "form of the bag inside it")
      ->capture_default_str()
      ->check(CLI::IsMember({"xml", "binary"}));
  app.add_flag("-q,--quiet", quiet, "do not print a line per request");
  CLI11_PARSE(app, argc, argv);
  if (anyPorts) options.httpPort = options.httpsPort = options.dashboardPort = 0;
  options.storebag.maxAgeOfBag = !maxAge;
  if (maxAge) options.storebag.maxAge = maxAge;
  options.storebag.container = *propertyListFormFromText(container);
  options.storebag.bag = *propertyListFormFromText(bag);
  if (!quiet) options.observer = printRequest;

  // Blocked before any thread exists, so that only sigwait() below receives them.
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  ::pthread_sigmask(SIG_BLOCK, &signals, nullptr);

  const auto running = collector::Collector::start(std::move(options));
  if (!running) return fail(running.error());
  if (const auto printed = printReady(**running); !printed) return fail(printed.error());
  int signal = 0;
  ::sigwait(&signals, &signal);
  (*running)->stop();
  return 0;
}
