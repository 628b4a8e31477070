#pragma once

#include <algorithm>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/core/Log.h"

namespace orvanta::test {

// Gathers the process's log lines while it lives, as "<level>text". Thread-safe.
class LogCapture final : public platform::LogSink {
 public:
  explicit LogCapture(platform::LogLevel level = platform::LogLevel::debug) : _before(platform::installedLogSink()) {
    platform::installLogSink(this);
    platform::setLogLevel(level);
  }
  ~LogCapture() override {
    platform::installLogSink(_before);
    const std::lock_guard lock(_mutex);  // behind the last writer
  }
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  void write(platform::LogLevel level, std::string_view line) override {
    const std::lock_guard lock(_mutex);
    _lines.push_back("<" + std::to_string(static_cast<int>(level)) + ">" + std::string(line));
  }
  std::vector<std::string> lines() const {
    const std::lock_guard lock(_mutex);
    return _lines;
  }
  void clear() {
    const std::lock_guard lock(_mutex);
    _lines.clear();
  }
  // How many lines hold the text; with the level given as "<5>" in front it must be the whole line's beginning.
  std::size_t count(std::string_view text) const {
    const std::lock_guard lock(_mutex);
    return static_cast<std::size_t>(std::count_if(
        _lines.begin(), _lines.end(), [&](const auto& line) { return line.find(text) != std::string::npos; }));
  }
  bool contains(std::string_view text) const { return count(text) > 0; }

 private:
  platform::LogSink* _before;
  mutable std::mutex _mutex;
  std::vector<std::string> _lines;  // guarded by _mutex
};

}  // namespace orvanta::test
