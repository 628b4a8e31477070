#include "daemon/DaemonPlatform.h"

#include <cstdlib>
#include <filesystem>
#include <string_view>

#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "platform/host/JsonLinesPowerLog.h"
#include "platform/host/LibraryPowerLog.h"

namespace orvanta {

namespace {
// Jobs are short, blocked ones get a stand-in, and what computes for long has threads of its own: waking a second
// thread would cost more than it takes off the first.
constexpr std::size_t kPoolThreads = 1;
}  // namespace

std::unique_ptr<Platform> makeDaemonPlatform(FileLocations files) {
  Platform::Parts parts;
  parts.clock = std::make_unique<platform::SystemClock>();
  parts.device =
      std::make_unique<platform::LinuxDeviceProperties>(files.configurationDirectory, std::string(kOrvantaServiceName));
  parts.defaults =
      std::make_unique<platform::UserDefaults>(files.stateDirectory, std::string(kOrvantaUserDefaultsDomain));
  parts.pool = std::make_unique<platform::WorkPool>(kPoolThreads);
  platform::HttpClientOptions options;
  options.caFile = files.caFile;
  parts.http = platform::makeCurlHttpClient(*parts.pool, options);
  parts.powerLog = platform::LibraryPowerLog::load();
  if (!parts.powerLog) {
    parts.powerLog =
        std::make_unique<platform::JsonLinesPowerLog>(files.stateDirectory + "/powerlog.jsonl", *parts.clock);
  }
  parts.files = std::move(files);
  return std::make_unique<Platform>(std::move(parts));
}

std::map<std::string, std::string> sandboxVariables(const FileLocations& files) {
  std::string caDirectory;
  if (!files.caFile.empty()) {
    // The directory that holds the file itself: a link may point elsewhere.
    std::error_code error;
    const auto real = std::filesystem::canonical(files.caFile, error);
    caDirectory = (error ? std::filesystem::path(files.caFile) : real).parent_path().string();
  }
  return {{"RUNTIME_DIRECTORY", files.runtimeDirectory},
          {"STATE_DIRECTORY", files.stateDirectory},
          {"CONFIGURATION_DIRECTORY", files.configurationDirectory},
          {"ORVANTA_FRAMEWORK", files.frameworkDirectory},
          {"ORVANTA_PLUGINS", files.plugInsDirectory},
          {"ORVANTA_CA_DIRECTORY", caDirectory}};
}

std::unique_ptr<platform::Sandbox> enterDaemonSandbox(const FileLocations& files) {
  const char* setting = std::getenv("ORVANTA_SANDBOX");
  if (setting != nullptr && std::string_view(setting) == "off") {
    ORVANTA_LOG(warning, "main: ORVANTA_SANDBOX is off: the daemon runs without its sandbox");
    return platform::Sandbox::none();
  }
  auto entered = platform::Sandbox::enter(files.frameworkDirectory + "/sandbox", std::string(kOrvantaServiceName),
                                          sandboxVariables(files));
  if (!entered) {
    ORVANTA_LOG(error, "main: Failed to enter sandbox {}: {}", kOrvantaServiceName, entered.error());
    return nullptr;
  }
  ORVANTA_LOG(info, "main: {}", (*entered)->description());
  return std::move(*entered);
}

bool closeDaemonSandbox(platform::Sandbox& sandbox) {
  const auto started = sandbox.started();
  if (!started) ORVANTA_LOG(error, "main: Failed to enter sandbox {}: {}", kOrvantaServiceName, started.error());
  return started.ok();
}

}  // namespace orvanta
