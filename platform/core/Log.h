#pragma once

#include <fmt/format.h>

#include <iterator>

#include "platform/core/LogSink.h"

// Logs one line. The arguments are neither evaluated nor formatted when the level is off.
//
// The wording of existing lines is fixed, odd spellings too: people and tools search for it.
#define PLATFORM_LOG(LEVEL, ...)                                                            \
  do {                                                                                      \
    if (::orvanta::platform::logEnabled(::orvanta::platform::LogLevel::LEVEL))              \
      ::orvanta::platform::logFormatted(::orvanta::platform::LogLevel::LEVEL, __VA_ARGS__); \
  } while (false)

namespace orvanta::platform {

template <class... Args>
void logFormatted(LogLevel level, fmt::format_string<Args...> format, Args&&... args) {
  fmt::memory_buffer buffer;
  fmt::format_to(std::back_inserter(buffer), format, std::forward<Args>(args)...);
  writeLogLine(level, std::string_view(buffer.data(), buffer.size()));
}

}  // namespace orvanta::platform
