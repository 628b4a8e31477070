#pragma once

#include <chrono>
#include <cstdint>

namespace orvanta::platform {

// A time-of-day record: whole seconds since 1970-01-01 UTC and microseconds.
struct TimeValue {
  std::int32_t seconds = 0;
  std::int32_t microseconds = 0;
  friend bool operator==(const TimeValue&, const TimeValue&) = default;
};

// Where the daemon takes its time from, so that tests can advance it. Callable from any thread.
class Clock {
 public:
  virtual ~Clock() = default;
  virtual TimeValue timeOfDay() const = 0;
  // Wall clock in seconds since 1970, for ages that survive in files and caches.
  virtual double wallSeconds() const = 0;
};

class SystemClock final : public Clock {
 public:
  TimeValue timeOfDay() const override;
  double wallSeconds() const override;
};

}  // namespace orvanta::platform
