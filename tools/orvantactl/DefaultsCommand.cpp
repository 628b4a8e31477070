#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <utility>

#include "interface/OrvantaConstants.h"
#include "platform/LogSink.h"
#include "platform/UserDefaults.h"
#include "tools/orvantactl/ClientOptions.h"
#include "tools/orvantactl/Commands.h"
#include "tools/orvantactl/DefaultsValue.h"
#include "tools/orvantactl/ExitStatus.h"
#include "tools/orvantactl/JsonValues.h"

namespace orvanta::ctl {

namespace {

// What the store has to say about its file is said to the person who asked.
class ComplainingLog final : public platform::LogSink {
 public:
  ComplainingLog() {
    platform::installLogSink(this);
    platform::setLogLevel(platform::LogLevel::warning);
  }
  ~ComplainingLog() override { platform::installLogSink(nullptr); }
  void write(platform::LogLevel /*level*/, std::string_view line) override { complain(std::string(line)); }
};

struct DefaultsOptions {
  std::string stateDirectory;
  std::string key;
  std::string text;
  std::string type = "string";

  std::string directory() const {
    if (!stateDirectory.empty()) return stateDirectory;
    const char* set = std::getenv("STATE_DIRECTORY");
    const std::string_view value = set == nullptr ? "" : set;
    std::string first(value.substr(0, value.find(':')));
    return first.empty() ? "/var/lib/orvanta" : first;
  }
  platform::UserDefaults open() const { return {directory(), std::string(kOrvantaUserDefaultsDomain)}; }
};

int read(const DefaultsOptions& options) {
  auto defaults = options.open();
  if (options.key.empty()) {
    printLine(writeTaggedJson(defaults.all(), true));
    return kAllTaken;
  }
  const auto value = defaults.value(options.key);
  if (!value) {
    complain("'" + options.key + "' is not set in " + defaults.path());
    return kSomethingNotTaken;
  }
  printLine(showDefaultsValue(*value));
  return kAllTaken;
}

int store(const DefaultsOptions& options, platform::Value value) {
  // A store makes its directory; here a missing one is a typing error, or the daemon has never run.
  if (!std::filesystem::is_directory(options.directory())) {
    complain("There is no directory " + options.directory());
    return kSomethingNotTaken;
  }
  auto defaults = options.open();
  const auto stored = defaults.set(options.key, std::move(value));
  if (stored) return kAllTaken;
  complain(stored.error() + "; the file belongs to the daemon, so this usually takes its user or root");
  return kSomethingNotTaken;
}

int write(const DefaultsOptions& options) {
  auto value = parseDefaultsValue(options.text, options.type);
  if (value) return store(options, std::move(*value));
  complain(value.error());
  return kUsage;
}

int erase(const DefaultsOptions& options) {
  if (!options.open().value(options.key)) {
    complain("'" + options.key + "' is not set");
    return kSomethingNotTaken;
  }
  return store(options, nullptr);
}

}  // namespace

void addDefaultsCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<DefaultsOptions>();
  auto& command = *app.add_subcommand("defaults", "Reads and changes the daemon's user defaults");
  command.require_subcommand(1);
  command.footer(
      "Keys that the daemon reads: environmentType (0 none, 1 development, 2 internal, 3 seed, 4 release; read once, "
      "at\n"
      "its start), orvanta_storebag_url, httpsPostURL, httpsRealtimePostURL, forceEventLogging.\n"
      "Example: orvantactl defaults write environmentType 1 --type int");
  command
      .add_option("--state-dir", options->stateDirectory,
                  "Directory of the defaults; default: $STATE_DIRECTORY, else /var/lib/orvanta")
      ->type_name("DIR");
  command.fallthrough();

  auto& reading = *command.add_subcommand("read", "Shows one value, or all of them as JSON");
  reading.add_option("KEY", options->key, "The key to show; default: all");
  reading.callback([options, &status] {
    const ComplainingLog log;
    status = read(*options);
  });

  auto& writing = *command.add_subcommand("write", "Sets a key");
  writing.add_option("KEY", options->key, "The key to set")->required();
  writing.add_option("VALUE", options->text, "Its value")->required();
  writing.add_option("--type", options->type, "What VALUE is; default: string")
      ->check(CLI::IsMember({"string", "int", "float", "bool", "json"}))
      ->type_name("T");
  writing.callback([options, &status] {
    const ComplainingLog log;
    status = write(*options);
  });

  auto& deleting = *command.add_subcommand("delete", "Removes a key");
  deleting.add_option("KEY", options->key, "The key to remove")->required();
  deleting.callback([options, &status] {
    const ComplainingLog log;
    status = erase(*options);
  });
}

}  // namespace orvanta::ctl
