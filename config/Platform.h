#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <typeindex>
#include <unordered_map>

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

// The device as the daemon sees it. main makes the Linux one, tests make one of the parts that they want; everything
// that is "once per process" is once per Platform. It outlives all that was made from it. The members are constant
// after construction and each is thread-safe.
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
  ~Platform();  // http first, then the pool, then the rest

  const FileLocations& files() const { return _parts.files; }
  platform::Clock& clock() const { return *_parts.clock; }
  platform::DeviceProperties& device() const { return *_parts.device; }
  platform::UserDefaults& defaults() const { return *_parts.defaults; }
  platform::WorkPool& pool() const { return *_parts.pool; }
  platform::HttpClient& http() const { return *_parts.http; }
  platform::PowerLog& powerLog() const { return *_parts.powerLog; }
  platform::KeepAlive& keepAlive() { return _keepAlive; }

  // The one T of this platform, made by `make` on first use; later calls give the same object. `make` runs under a lock
  // (it may ask for another once-value of the same platform). T lives as long as the platform.
  template <class T, class Make>
  T& once(Make make) {
    const std::lock_guard lock(_onceMutex);
    auto& slot = _onceValues[std::type_index(typeid(T))];
    if (!slot) slot = std::make_shared<T>(make());
    return *static_cast<T*>(slot.get());
  }

 private:
  Parts _parts;
  platform::KeepAlive _keepAlive;
  std::recursive_mutex _onceMutex;
  std::unordered_map<std::type_index, std::shared_ptr<void>> _onceValues;  // guarded by _onceMutex
};

}  // namespace orvanta
