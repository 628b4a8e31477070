#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

namespace orvanta::ctl {

// How far a long input has come.
struct Progress {
  std::uint64_t events = 0;
  std::uint64_t bytes = 0;
  std::optional<std::uint64_t> totalBytes;  // nullopt: the input's length is not known
  double seconds = 0;                       // since the beginning
};

// "[=====>    ]  52 %  1234 events  5678/s", or without the bar when the total is not known.
std::string renderProgress(const Progress& progress);

// Shows progress on standard error once the input turns out to be long: after a second or a thousand events, and then
// at most ten times a second. Owned by the command and used on its thread; without `enabled` it shows nothing.
class ProgressBar {
 public:
  ProgressBar(bool enabled, std::optional<std::uint64_t> totalBytes)
      : _enabled(enabled), _totalBytes(totalBytes), _begin(std::chrono::steady_clock::now()) {}
  void update(std::uint64_t events, std::uint64_t bytes);
  // Removes the bar again, so that other lines can be written.
  void clear();

 private:
  const bool _enabled;
  const std::optional<std::uint64_t> _totalBytes;
  const std::chrono::steady_clock::time_point _begin;
  double _shownAt = 0;  // seconds since _begin
  bool _shown = false;
};

}  // namespace orvanta::ctl
