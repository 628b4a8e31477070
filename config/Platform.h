#pragma once

#include <memory>
#include <string>

#include "platform/core/Clock.h"
#include "platform/host/DeviceProperties.h"
#include "platform/host/KeepAlive.h"
#include "platform/host/PowerLog.h"
#include "platform/host/UserDefaults.h"
#include "platform/http/HttpClient.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta {

// Directories and files, from the environment (see docs/operation.md). No trailing slashes.
struct FileLocations {
  std::string runtimeDirectory = "/run/orvanta";
  std::string stateDirectory = "/var/lib/orvanta";
  std::string configurationDirectory = "/etc/orvanta";
  std::string frameworkDirectory = "/usr/share/orvanta";
  std::string plugInsDirectory = "/usr/lib/orvanta/PlugIns";
  std::string caFile;  // empty: the system's certificates

  // Reads the variables; of systemd's colon-separated lists the first entry counts.
  static FileLocations fromEnvironment();
};

// The device as the daemon sees it. main makes the Linux one, tests make one of the parts that they want. It outlives
// all that was made from it, the services of the layers (DaemonServices) included. The members are constant after
// construction and each is thread-safe.
class Platform {
 public:
  struct Parts {
    FileLocations files;
    std::unique_ptr<platform::Clock> clock;
    std::unique_ptr<platform::DeviceProperties> device;
    std::unique_ptr<platform::UserDefaults> defaults;
    std::unique_ptr<platform::WorkPool> pool;
    std::unique_ptr<platform::HttpClient> http;
    std::unique_ptr<platform::PowerLog> powerLog;
  };
  explicit Platform(Parts parts) : _parts(std::move(parts)) {}
  Platform(const Platform&) = delete;
  Platform& operator=(const Platform&) = delete;
  ~Platform();  // stops; then destroys http first, then the pool, then the rest

  const FileLocations& files() const { return _parts.files; }
  platform::Clock& clock() const { return *_parts.clock; }
  platform::DeviceProperties& device() const { return *_parts.device; }
  platform::UserDefaults& defaults() const { return *_parts.defaults; }
  platform::WorkPool& pool() const { return *_parts.pool; }
  platform::HttpClient& http() const { return *_parts.http; }
  platform::PowerLog& powerLog() const { return *_parts.powerLog; }
  platform::KeepAlive& keepAlive() { return _keepAlive; }

  // Nothing new comes in, then no job runs any more: afterwards what jobs and completions use can be destroyed, while
  // the client and the pool are still there for what it holds of them. On the owner's thread; a second call does
  // nothing.
  void stop();

 private:
  Parts _parts;
  platform::KeepAlive _keepAlive;
  bool _stopped = false;  // the owner's thread only
};

}  // namespace orvanta
