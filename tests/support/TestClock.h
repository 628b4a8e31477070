#pragma once

#include <atomic>
#include <cmath>

#include "platform/core/Clock.h"

namespace orvanta::test {

// A clock that stands still until a test moves it. Thread-safe.
class TestClock final : public platform::Clock {
 public:
  explicit TestClock(double now = 1'700'000'000) : _now(now) {}
  void advance(double seconds) { _now = _now + seconds; }
  void set(double seconds) { _now = seconds; }
  platform::TimeValue timeOfDay() const override {
    const double now = _now;
    const double whole = std::floor(now);
    return {static_cast<std::int32_t>(whole), static_cast<std::int32_t>(std::lround((now - whole) * 1e6))};
  }
  double wallSeconds() const override { return _now; }

 private:
  std::atomic<double> _now;
};

}  // namespace orvanta::test
