#pragma once

#include <chrono>
#include <cstddef>
#include <memory>

#include "backends/PendingPosts.h"
#include "backends/UploadBudget.h"
#include "config/ConfigServices.h"
#include "platform/core/Mutex.h"
#include "platform/host/BundleLoader.h"

namespace orvanta {

// Counts the datagrams that wait on network queues for their first transmission. Thread-safe.
class PendingDatagrams {
 public:
  void begin();
  void end();
  // Returns whether none is left, after at most `timeout`. For tests. Not from a job of the pool.
  bool waitUntilSent(std::chrono::milliseconds timeout);

 private:
  platform::Mutex _mutex;
  platform::Condition _none;
  std::size_t _count GUARDED_BY(_mutex) = 0;
};

// The things that the backends of all sessions share. Owned by DaemonServices; destroyed when the platform has stopped.
// Each member is thread-safe.
struct BackendServices {
  explicit BackendServices(Platform& platform) : config(platform) {}

  Platform& platform() const { return config.platform(); }

  ConfigServices config;
  // Shared with the posts, some of which the pool drops only when it goes.
  const std::shared_ptr<PendingPosts> pendingPosts = std::make_shared<PendingPosts>();
  UploadBudget uploadBudget;
  PendingDatagrams pendingDatagrams;
  platform::BundleLoader plugIns;
};

}  // namespace orvanta
