#include <fmt/core.h>

#include <cstdio>
#include <exception>
#include <string_view>

#include "bench/Stages.h"

// Prints, for each stage of an event's way and for the whole, events per second, CPU microseconds per event and the
// ratio to the raw limit measured in the same run. Absolute values depend on the machine; the ratios must not grow.
int main(int argumentCount, char** arguments) {
  using namespace orvanta::bench;
  const std::string_view only = argumentCount > 1 ? arguments[1] : "";
  if (!only.empty() && only != "calls" && only != "dashboard" && only != "stages" && only != "whole" &&
      only != "sessions") {
    fmt::print("usage: orvanta-bench [calls | dashboard | sessions | stages | whole]\n");
    return 2;
  }
  std::setvbuf(stdout, nullptr, _IOLBF, 0);
  try {
    if (only.empty() || only == "calls") benchCallPath();
    if (only.empty() || only == "dashboard") benchDashboard();
    if (only.empty() || only == "sessions") benchSessions();
    if (only == "calls" || only == "dashboard" || only == "sessions") return 0;
    const RawLimits limits = benchStages();
    if (only != "stages") benchWholePath(limits);
  } catch (const std::exception& error) {
    fmt::print(stderr, "orvanta-bench: {}\n", error.what());
    return 1;
  }
  return 0;
}
