#include "tools/orvantactl/ProgressBar.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdio>

namespace orvanta::ctl {

namespace {
constexpr std::size_t kWidth = 30;
constexpr std::uint64_t kManyEvents = 1000;
constexpr double kLongSeconds = 1;
constexpr double kRefreshSeconds = 0.1;
}  // namespace

std::string renderProgress(const Progress& progress) {
  const auto rate = progress.seconds > 0 ? static_cast<double>(progress.events) / progress.seconds : 0;
  auto count = fmt::format("{} events  {:.0f}/s", progress.events, rate);
  if (!progress.totalBytes || *progress.totalBytes == 0) return count;
  const double share = std::min(1.0, static_cast<double>(progress.bytes) / static_cast<double>(*progress.totalBytes));
  const auto filled = static_cast<std::size_t>(share * kWidth);
  std::string bar(filled, '=');
  if (filled < kWidth) bar += '>';
  bar.resize(kWidth, ' ');
  return fmt::format("[{}] {:3.0f} %  {}", bar, share * 100, count);
}

void ProgressBar::update(std::uint64_t events, std::uint64_t bytes) {
  if (!_enabled) return;
  const double now = std::chrono::duration<double>(std::chrono::steady_clock::now() - _begin).count();
  if (now < _shownAt + kRefreshSeconds) return;
  if (events < kManyEvents && now < kLongSeconds) return;
  _shownAt = now;
  _shown = true;
  std::fputs(("\r\x1b[K" + renderProgress({events, bytes, _totalBytes, now})).c_str(), stderr);
  std::fflush(stderr);
}

void ProgressBar::clear() {
  if (!_shown) return;
  _shown = false;
  std::fputs("\r\x1b[K", stderr);
  std::fflush(stderr);
}

}  // namespace orvanta::ctl
