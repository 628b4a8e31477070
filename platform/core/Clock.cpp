#include "platform/core/Clock.h"

#include <ctime>

namespace orvanta::platform {

namespace {
timespec now() {
  timespec value{};
  ::clock_gettime(CLOCK_REALTIME, &value);
  return value;
}
}  // namespace

TimeValue SystemClock::timeOfDay() const {
  const timespec value = now();
  return {static_cast<std::int32_t>(value.tv_sec), static_cast<std::int32_t>(value.tv_nsec / 1000)};
}

double SystemClock::wallSeconds() const {
  const timespec value = now();
  return static_cast<double>(value.tv_sec) + static_cast<double>(value.tv_nsec) / 1e9;
}

}  // namespace orvanta::platform
