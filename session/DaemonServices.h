#pragma once

#include <memory>

#include "backends/BackendServices.h"
#include "platform/core/Mutex.h"
#include "platform/listen/Entitlements.h"

namespace orvanta {

// All that is one a process, besides the device itself: what each layer shares is made by its own class and owned here.
// main makes one, tests make their own. It goes before the platform, which it stops first, so that no job or completion
// still uses the services, and the client and the pool are still there for the lanes and queues that they hold. Each
// member is thread-safe.
struct DaemonServices {
  explicit DaemonServices(Platform& device)
      : platform(device), backends(device), entitlements(device.files().configurationDirectory + "/entitlements.d") {}
  ~DaemonServices() { platform.stop(); }
  DaemonServices(const DaemonServices&) = delete;
  DaemonServices& operator=(const DaemonServices&) = delete;

  ConfigServices& config() { return backends.config; }

  Platform& platform;
  BackendServices backends;
  // One for all flushes. Shared with the requests, since the pool may drop the last completions only when it goes.
  const std::shared_ptr<platform::Mutex> flushLock = std::make_shared<platform::Mutex>();
  // Says which peers may connect.
  platform::Entitlements entitlements;
};

}  // namespace orvanta
