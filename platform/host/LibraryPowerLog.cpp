#include "platform/host/LibraryPowerLog.h"

#include <dlfcn.h>

#include <string>
#include <vector>

#include "platform/codec/MessagePack.h"
#include "platform/core/Log.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

namespace {

constexpr const char* kFunction = "VMLogRegisteredEvent";

std::string linkersReason() {
  const char* const reason = ::dlerror();
  return reason == nullptr ? "(null)" : reason;
}

}  // namespace

std::unique_ptr<LibraryPowerLog> LibraryPowerLog::load(const char* library) {
  void* const handle = ::dlopen(library, RTLD_NOW | RTLD_LOCAL);
  if (handle == nullptr) {
    PLATFORM_LOG(info, "PowerLog(load): No platform power log, records go to a file: {}", linkersReason());
    return nullptr;
  }
  const auto function = reinterpret_cast<Function>(::dlsym(handle, kFunction));
  if (function == nullptr) {
    PLATFORM_LOG(warning, "PowerLog(load): {} is of no use, records go to a file: {}", library, linkersReason());
    return nullptr;
  }
  PLATFORM_LOG(info, "PowerLog(load): Loaded {}", library);
  return std::unique_ptr<LibraryPowerLog>(new LibraryPowerLog(function));  // NOLINT(modernize-make-unique): private
}

void LibraryPowerLog::registeredEvent(std::int32_t event, std::string_view sender, const Dictionary& record) {
  std::vector<std::uint8_t> bytes;
  MessagePackWriter(bytes).dictionary(record);
  const VMPowerLogRecord packed{bytes.data(), bytes.size()};
  const BlockingScope blocking;  // the library may talk to another process
  _logRegisteredEvent(event, std::string(sender).c_str(), &packed, nullptr);
}

}  // namespace orvanta::platform
