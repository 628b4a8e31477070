#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>

#include "interface/OrvantaConstants.h"
#include "platform/core/Log.h"
#include "platform/host/UserDefaults.h"
#include "tools/orvantactl/Commands.h"
#include "tools/orvantactl/JsonValues.h"
#include "tools/orvantactl/Output.h"

namespace orvanta::ctl {

namespace {

// Passes the store's log lines about its file on to the person who asked.
class ComplainingLog final : public platform::LogSink {
 public:
  ComplainingLog() {
    platform::installLogSink(this);
    platform::setLogLevel(platform::LogLevel::warning);
  }
  ~ComplainingLog() override { platform::installLogSink(nullptr); }
  void write(platform::LogLevel level, std::string_view line) override {
    _failed = _failed || level <= platform::LogLevel::error;
    complain(std::string(line));
  }
  // Returns whether the file could not be read or is invalid, so that the store returned something else.
  bool failed() const { return _failed; }

 private:
  bool _failed = false;
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

// The store takes a missing directory for an empty one, or makes it; here it is a typing error, or the daemon has never
// run.
bool directoryIsThere(const DefaultsOptions& options) {
  std::error_code error;
  if (std::filesystem::is_directory(options.directory(), error)) return true;
  const bool hidden = error && error != std::errc::no_such_file_or_directory;
  complain(hidden ? "cannot look at " + options.directory() + ": " + error.message()
                  : "There is no directory " + options.directory());
  return false;
}

int read(const DefaultsOptions& options) {
  const ComplainingLog log;
  if (!directoryIsThere(options)) return kSomethingNotTaken;
  auto defaults = options.open();
  const auto all = defaults.all();
  if (log.failed()) return kSomethingNotTaken;
  if (options.key.empty()) {
    printLine(writeTaggedJson(all, true));
    return kAllTaken;
  }
  const auto* value = all.find(options.key);
  if (value == nullptr) {
    complain("'" + options.key + "' is not set in " + defaults.path());
    return kSomethingNotTaken;
  }
  printLine(showDefaultsValue(*value));
  return kAllTaken;
}

int store(const DefaultsOptions& options, Value value) {
  auto defaults = options.open();
  const auto stored = defaults.set(options.key, std::move(value));
  if (stored) return kAllTaken;
  const bool forbidden = ::access(options.directory().c_str(), R_OK | W_OK | X_OK) != 0 ||
                         (::access(defaults.path().c_str(), R_OK) != 0 && errno != ENOENT);
  complain(stored.error() +
           (forbidden ? "; the file belongs to the daemon, so this usually takes its user or root" : ""));
  return kSomethingNotTaken;
}

int write(const DefaultsOptions& options) {
  auto value = parseDefaultsValue(options.text, options.type);
  if (!value) {
    complain(value.error());
    return kUsage;
  }
  const ComplainingLog log;
  return directoryIsThere(options) ? store(options, std::move(*value)) : kSomethingNotTaken;
}

int erase(const DefaultsOptions& options) {
  const ComplainingLog log;
  if (!directoryIsThere(options)) return kSomethingNotTaken;
  const bool isSet = options.open().value(options.key).has_value();
  if (isSet) return store(options, nullptr);
  if (!log.failed()) complain("'" + options.key + "' is not set");
  return kSomethingNotTaken;
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
  reading.callback([options, &status] { status = read(*options); });

  auto& writing = *command.add_subcommand("write", "Sets a key");
  writing.add_option("KEY", options->key, "The key to set")->required();
  writing.add_option("VALUE", options->text, "Its value")->required();
  writing.add_option("--type", options->type, "What VALUE is; default: string")
      ->check(CLI::IsMember({"string", "int", "float", "bool", "json"}))
      ->type_name("T");
  writing.callback([options, &status] { status = write(*options); });

  auto& deleting = *command.add_subcommand("delete", "Removes a key");
  deleting.add_option("KEY", options->key, "The key to remove")->required();
  deleting.callback([options, &status] { status = erase(*options); });
}

}  // namespace orvanta::ctl
