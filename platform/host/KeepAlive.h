#pragma once

#include <atomic>
#include <cstdint>
#include <string_view>

namespace orvanta::platform {

// Tells the service manager whether the process is busy. begin() and end() come in pairs from any thread.
// Without a service manager it only counts.
class KeepAlive {
 public:
  void begin();
  void end();
  std::uint64_t begun() const { return _begun.load(); }
  std::uint64_t ended() const { return _ended.load(); }
  // READY=1, once listening.
  static void ready();
  // Free text behind the busy/idle mark; it goes with the mark's next change.
  static void status(std::string_view text);
  // Returns whether a service manager listens.
  static bool isHeard();
  static void stopping();

 private:
  std::atomic<std::uint64_t> _begun{0};
  std::atomic<std::uint64_t> _ended{0};
};

}  // namespace orvanta::platform
