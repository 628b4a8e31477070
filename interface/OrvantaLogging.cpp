#include "interface/OrvantaLogging.h"

#include <fmt/format.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdlib>
#include <iterator>
#include <memory>
#include <string_view>

namespace orvanta {

namespace {

class SyslogSink final : public platform::LogSink {
 public:
  // openlog() keeps the pointer, so the sender lives as long as the sink.
  SyslogSink(std::string sender, int facility) : _sender(std::move(sender)) {
    ::openlog(_sender.c_str(), LOG_PID | LOG_NDELAY, facility);
  }
  ~SyslogSink() override { ::closelog(); }
  void write(platform::LogLevel level, std::string_view line) override {
    ::syslog(static_cast<int>(level), "%.*s", static_cast<int>(line.size()), line.data());
  }

 private:
  const std::string _sender;
};

// One write(2) a line, so that lines of several threads never mix.
class StandardErrorSink final : public platform::LogSink {
 public:
  void write(platform::LogLevel level, std::string_view line) override {
    // Most lines fit without allocating, on which the watcher of refused system calls relies.
    fmt::memory_buffer text;
    fmt::format_to(std::back_inserter(text), "<{}>{}\n", static_cast<int>(level), line);
    std::string_view rest(text.data(), text.size());
    while (!rest.empty()) {
      const ssize_t written = ::write(STDERR_FILENO, rest.data(), rest.size());
      if (written <= 0) return;
      rest.remove_prefix(static_cast<std::size_t>(written));
    }
  }
};

std::unique_ptr<platform::LogSink>& activeSink() {
  static std::unique_ptr<platform::LogSink> sink;
  return sink;
}

int facilityNumber(std::string_view facility) {
  return facility == "Daemon" ? LOG_DAEMON : LOG_USER;
}

}  // namespace

void OrvantaLogging::startLogging(const std::string& sender, const std::string& facility) {
  const char* destination = std::getenv("ORVANTA_LOG");
  const std::string_view where = destination == nullptr ? "syslog" : destination;
  if (where == "stderr") {
    activeSink() = std::make_unique<StandardErrorSink>();
  } else {
    activeSink() = std::make_unique<SyslogSink>(sender, facilityNumber(facility));
  }
  platform::installLogSink(activeSink().get());
  if (where != "stderr" && where != "syslog") {
    ORVANTA_LOG(warning, "startLogging: ORVANTA_LOG is '{}', neither 'syslog' nor 'stderr': using syslog", where);
  }

  const char* levelText = std::getenv("ORVANTA_LOG_LEVEL");
  const std::string_view level = levelText == nullptr ? "6" : levelText;
  if (level.size() == 1 && level[0] >= '3' && level[0] <= '7') {
    platform::setLogLevel(static_cast<platform::LogLevel>(level[0] - '0'));
  } else {
    ORVANTA_LOG(warning, "startLogging: ORVANTA_LOG_LEVEL is '{}', not a number from 3 to 7: using 6", level);
  }
}

void OrvantaLogging::close() {
  platform::installLogSink(nullptr);
  activeSink().reset();
}

}  // namespace orvanta
