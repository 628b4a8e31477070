#pragma once

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <array>
#include <cstdlib>
#include <string>
#include <vector>

#include "platform/core/UniqueFd.h"
#include "platform/ipc/Connect.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::test {

// Hears what a service manager would. Used by one thread.
class ServiceManager {
 public:
  ServiceManager() : _socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0)) {
    const auto address = platform::unixAddress(path());
    EXPECT_EQ(::bind(_socket.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address), 0);
  }
  ~ServiceManager() { ::unsetenv("NOTIFY_SOCKET"); }
  ServiceManager(const ServiceManager&) = delete;
  ServiceManager& operator=(const ServiceManager&) = delete;

  std::string path() const { return _directory / "notify"; }
  // Makes this process tell it.
  void setEnvironment() const { ::setenv("NOTIFY_SOCKET", path().c_str(), 1); }
  // The messages since the last call.
  std::vector<std::string> heard() const {
    std::vector<std::string> messages;
    std::array<char, 1024> buffer{};
    for (ssize_t size = 0; (size = ::recv(_socket.get(), buffer.data(), buffer.size(), 0)) > 0;) {
      messages.emplace_back(buffer.data(), static_cast<std::size_t>(size));
    }
    return messages;
  }

 private:
  TemporaryDirectory _directory;
  platform::UniqueFd _socket;
};

}  // namespace orvanta::test
