#include "platform/host/BundleLoader.h"

#include <dlfcn.h>

#include <filesystem>
#include <system_error>

#include "platform/core/Log.h"

namespace orvanta::platform {

const void* LoadedBundle::symbol(const char* name) const {
  return ::dlsym(_library, name);
}

const LoadedBundle* BundleLoader::load(const std::string& bundleDirectory) {
  const MutexLock lock(_mutex);
  auto& slot = _loaded[bundleDirectory];
  if (slot) return slot.get();

  const std::string library = bundleDirectory + "/" + std::filesystem::path(bundleDirectory).stem().string() + ".so";
  // The linker would open a FIFO, too, and wait in it with its lock held, which every new thread needs.
  std::error_code ignored;
  const auto status = std::filesystem::status(library, ignored);
  if (std::filesystem::exists(status) && !std::filesystem::is_regular_file(status)) {
    PLATFORM_LOG(error, "BundleLoader(load): Could not load {}: not a regular file", library);
    return nullptr;
  }
  void* const handle = ::dlopen(library.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (handle == nullptr) {
    const char* const reason = ::dlerror();
    PLATFORM_LOG(error, "BundleLoader(load): Could not load {}: {}", library, reason == nullptr ? "(null)" : reason);
    return nullptr;
  }
  PLATFORM_LOG(info, "BundleLoader(load): Loaded {}", library);
  slot = std::make_unique<LoadedBundle>(handle);
  return slot.get();
}

}  // namespace orvanta::platform
