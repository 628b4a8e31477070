#pragma once

#include <string>

#include "platform/core/Log.h"

// The daemon's log lines go through this; see platform/core/Log.h.
#define ORVANTA_LOG(LEVEL, ...) PLATFORM_LOG(LEVEL, __VA_ARGS__)

namespace orvanta {

// Where log lines go: syslog under a sender name and a facility ("Daemon"), or standard error when ORVANTA_LOG=stderr,
// each line then written as "<level>text". ORVANTA_LOG_LEVEL (3 to 7, default 6) is the highest level written.
class OrvantaLogging {
 public:
  // Once per process, before other threads log. Takes both variables from the environment; an invalid value is logged
  // and the default used.
  static void startLogging(const std::string& sender, const std::string& facility);
  static void close();
};

}  // namespace orvanta
