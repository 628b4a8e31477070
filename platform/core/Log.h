#pragma once

#include <fmt/format.h>

#include <atomic>
#include <iterator>
#include <string_view>
#include <utility>

namespace orvanta::platform {

// syslog's numbers.
enum class LogLevel : int { error = 3, warning = 4, notice = 5, info = 6, debug = 7 };

// Takes finished log lines. Called from any thread, several at once.
class LogSink {
 public:
  virtual ~LogSink() = default;
  // `line` holds no line break.
  virtual void write(LogLevel level, std::string_view line) = 0;
};

// The process's log. A line above the level costs one comparison; the sink is never called for it.
// Until a sink is installed lines go nowhere. The caller keeps the sink alive for as long as it is installed.
void installLogSink(LogSink* sink);
LogSink* installedLogSink();
void setLogLevel(LogLevel level);
extern std::atomic<int> gLogLevel;  // read through logEnabled()
inline bool logEnabled(LogLevel level) {
  return static_cast<int>(level) <= gLogLevel.load(std::memory_order_relaxed);
}
// Writes one entry; line breaks inside `text` become the two characters "\n", other control characters "?".
void writeLogLine(LogLevel level, std::string_view text);

template <class... Args>
void logFormatted(LogLevel level, fmt::format_string<Args...> format, Args&&... args) {
  fmt::memory_buffer buffer;
  fmt::format_to(std::back_inserter(buffer), format, std::forward<Args>(args)...);
  writeLogLine(level, std::string_view(buffer.data(), buffer.size()));
}

}  // namespace orvanta::platform

// Logs one line. The arguments are neither evaluated nor formatted when the level is off.
//
// The wording of existing lines is fixed, odd spellings too: people and tools search for it.
#define PLATFORM_LOG(LEVEL, ...)                                                            \
  do {                                                                                      \
    if (::orvanta::platform::logEnabled(::orvanta::platform::LogLevel::LEVEL))              \
      ::orvanta::platform::logFormatted(::orvanta::platform::LogLevel::LEVEL, __VA_ARGS__); \
  } while (false)
