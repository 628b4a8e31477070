#pragma once

#include <map>
#include <memory>
#include <string>

#include "platform/core/Mutex.h"

namespace orvanta::platform {

// The code of a plug-in bundle, loaded into the process for good: a plug-in may have threads and handlers of its own,
// so that nothing ever unloads it. Immutable; any thread.
class LoadedBundle {
 public:
  explicit LoadedBundle(void* library) : _library(library) {}
  // The address of an exported name; null when the bundle does not export it.
  const void* symbol(const char* name) const;

 private:
  void* _library;
};

// Loads plug-in bundles, each once per loader. A bundle is a directory NAME.bundle that holds NAME.so. Thread-safe.
class BundleLoader {
 public:
  // The bundle, loaded now unless it was before; null when it cannot be, with the linker's reason in the log. What
  // failed is tried again by the next call, so that a bundle installed later is found.
  const LoadedBundle* load(const std::string& bundleDirectory);

 private:
  Mutex _mutex;
  std::map<std::string, std::unique_ptr<LoadedBundle>> _loaded GUARDED_BY(_mutex);  // by directory
};

}  // namespace orvanta::platform
