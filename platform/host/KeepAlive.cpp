#include "platform/host/KeepAlive.h"

#include <systemd/sd-daemon.h>

#include <algorithm>
#include <cstdlib>
#include <mutex>
#include <string>

namespace orvanta::platform {

namespace {

// What the service manager was told last. There is one service manager, however many KeepAlives there are.
struct Told {
  std::mutex mutex;
  // Guarded by mutex.
  std::uint64_t busy = 0;  // transactions under way
  std::string text;

  void tell(const char* before = "") {
    ::sd_notify(0, (before + ("STATUS=" + std::string(busy > 0 ? "busy" : "idle") + text)).c_str());
  }
  void change() {
    text.clear();
    tell();
  }
};

Told& told() {
  static Told value;
  return value;
}

}  // namespace

void KeepAlive::begin() {
  ++_begun;
  const std::lock_guard lock(told().mutex);
  if (++told().busy == 1) told().change();
}

void KeepAlive::end() {
  ++_ended;
  const std::lock_guard lock(told().mutex);
  if (told().busy > 0 && --told().busy == 0) told().change();
}

void KeepAlive::ready() {
  const std::lock_guard lock(told().mutex);
  told().tell("READY=1\n");
}

void KeepAlive::status(std::string_view text) {
  const std::lock_guard lock(told().mutex);
  told().text = text.empty() ? std::string() : "; " + std::string(text);
  std::replace(told().text.begin(), told().text.end(), '\n', ' ');  // a line break would begin another variable
  told().tell();
}

bool KeepAlive::isHeard() {
  return std::getenv("NOTIFY_SOCKET") != nullptr;  // NOLINT(concurrency-mt-unsafe): nobody sets it
}

void KeepAlive::stopping() {
  ::sd_notify(0, "STOPPING=1");
}

}  // namespace orvanta::platform
