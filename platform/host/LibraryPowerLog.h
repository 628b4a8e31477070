#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

#include "platform/host/PowerLog.h"
#include "platform/host/PowerLogLibrary.h"

namespace orvanta::platform {

// The device's own power log: the platform library that PowerLogLibrary.h describes. The library stays loaded for as
// long as the process lives. Thread-safe in so far as the library is.
class LibraryPowerLog final : public PowerLog {
 public:
  static constexpr const char* kLibrary = "libvoltmark.so.1";

  // Returns null when the library, or the function in it, is missing; the log has the linker's reason.
  static std::unique_ptr<LibraryPowerLog> load(const char* library = kLibrary);

  void registeredEvent(std::int32_t event, std::string_view sender, const Dictionary& record) override;

 private:
  using Function = decltype(&::VMLogRegisteredEvent);
  explicit LibraryPowerLog(Function function) : _logRegisteredEvent(function) {}

  const Function _logRegisteredEvent;
};

}  // namespace orvanta::platform
