#include "bench/Measure.h"

#include <fmt/core.h>

#include <algorithm>
#include <cmath>
#include <ctime>

namespace orvanta::bench {

double cpuMicroseconds(pid_t pid) {
  clockid_t clock = CLOCK_PROCESS_CPUTIME_ID;
  if (pid != 0 && ::clock_getcpuclockid(pid, &clock) != 0) return 0;
  timespec time{};
  if (::clock_gettime(clock, &time) != 0) return 0;
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
}

Figure figureOf(const Stretch& stretch, std::uint64_t events) {
  const auto count = static_cast<double>(std::max<std::uint64_t>(events, 1));
  const double cpu = stretch.cpu();
  return {count / (stretch.wallMicroseconds() / 1e6), cpu / count};
}

double percentile(std::vector<double> values, double share) {
  if (values.empty()) return 0;
  const auto index = static_cast<std::size_t>(share * static_cast<double>(values.size() - 1));
  std::nth_element(values.begin(), values.begin() + static_cast<std::ptrdiff_t>(index), values.end());
  return values[index];
}

double median(std::vector<double> values) {
  return percentile(std::move(values), 0.5);
}

void printHeading(const std::string& title) {
  fmt::print("\n{}\n{}\n", title, std::string(title.size(), '-'));
}

void printFigure(const std::string& name, const Figure& figure) {
  fmt::print("  {:<58} {:>12.0f} /s {:>10.3f} us CPU each\n", name, figure.perSecond, figure.cpuPerEvent);
}

void printRatio(const std::string& name, double value, double rawLimit, double goal) {
  const double ratio = rawLimit > 0 ? value / rawLimit : 0;
  fmt::print("  {:<58} {:>9.3f} us / {:.3f} us = {:.2f} x (goal {:.2f} x){}\n", name, value, rawLimit, ratio, goal,
             ratio <= goal ? "" : "  OVER");
}

}  // namespace orvanta::bench
