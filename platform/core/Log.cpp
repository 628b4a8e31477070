#include "platform/core/Log.h"

#include <string>

namespace orvanta::platform {

std::atomic<int> gLogLevel{static_cast<int>(LogLevel::info)};

namespace {
std::atomic<LogSink*> gSink{nullptr};

bool needsEscaping(std::string_view text) {
  for (const char c : text) {
    if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) return true;
  }
  return false;
}
}  // namespace

void installLogSink(LogSink* sink) {
  gSink.store(sink, std::memory_order_release);
}
LogSink* installedLogSink() {
  return gSink.load(std::memory_order_acquire);
}
void setLogLevel(LogLevel level) {
  gLogLevel.store(static_cast<int>(level), std::memory_order_relaxed);
}

void writeLogLine(LogLevel level, std::string_view text) {
  LogSink* sink = installedLogSink();
  if (sink == nullptr || !logEnabled(level)) return;
  if (!needsEscaping(text)) {
    sink->write(level, text);
    return;
  }
  std::string line;
  line.reserve(text.size() + 8);
  for (const char c : text) {
    if (c == '\n') {
      line += "\\n";
    } else if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) {
      line += c == '\t' ? ' ' : '?';
    } else {
      line += c;
    }
  }
  sink->write(level, line);
}

}  // namespace orvanta::platform
