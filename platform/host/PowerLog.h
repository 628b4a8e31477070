#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/core/Value.h"

namespace orvanta::platform {

// The device's power log. Callable from any thread; failures are not reported.
class PowerLog {
 public:
  virtual ~PowerLog() = default;
  virtual void registeredEvent(std::int32_t event, std::string_view sender, const Dictionary& record) = 0;
};

}  // namespace orvanta::platform
