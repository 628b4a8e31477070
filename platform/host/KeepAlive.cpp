#include "platform/host/KeepAlive.h"

#include <systemd/sd-daemon.h>

#include <algorithm>
#include <cstdlib>
#include <string>
#include <utility>

#include "platform/core/Mutex.h"

namespace orvanta::platform {

namespace {

// The last message to the service manager. There is one service manager, however many KeepAlives there are.
// Thread-safe.
class Told {
 public:
  void begin() {
    const MutexLock lock(_mutex);
    if (++_busy == 1) change();
  }
  void end() {
    const MutexLock lock(_mutex);
    if (_busy > 0 && --_busy == 0) change();
  }
  void ready() {
    const MutexLock lock(_mutex);
    tell("READY=1\n");
  }
  void setText(std::string text) {
    const MutexLock lock(_mutex);
    _text = std::move(text);
    tell();
  }

 private:
  void tell(const char* before = "") REQUIRES(_mutex) {
    ::sd_notify(0, (before + ("STATUS=" + std::string(_busy > 0 ? "busy" : "idle") + _text)).c_str());
  }
  void change() REQUIRES(_mutex) {
    _text.clear();
    tell();
  }

  Mutex _mutex;
  std::uint64_t _busy GUARDED_BY(_mutex) = 0;  // transactions under way
  std::string _text GUARDED_BY(_mutex);
};

Told& told() {
  static Told value;
  return value;
}

}  // namespace

void KeepAlive::begin() {
  ++_begun;
  told().begin();
}

void KeepAlive::end() {
  ++_ended;
  told().end();
}

void KeepAlive::ready() {
  told().ready();
}

void KeepAlive::status(std::string_view text) {
  std::string line = text.empty() ? std::string() : "; " + std::string(text);
  std::replace(line.begin(), line.end(), '\n', ' ');  // a line break would begin another variable
  told().setText(std::move(line));
}

bool KeepAlive::isHeard() {
  return std::getenv("NOTIFY_SOCKET") != nullptr;  // NOLINT(concurrency-mt-unsafe): the process never sets it
}

void KeepAlive::stopping() {
  ::sd_notify(0, "STOPPING=1");
}

}  // namespace orvanta::platform
