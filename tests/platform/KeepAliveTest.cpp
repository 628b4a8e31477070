#include "platform/KeepAlive.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <array>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include "platform/UniqueFd.h"
#include "platform/UnixAddress.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::test {
namespace {

using platform::KeepAlive;

// What a service manager would hear.
class ServiceManager {
 public:
  ServiceManager() : _socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0)) {
    const std::string path = _directory / "notify";
    const auto address = platform::unixAddress(path);
    EXPECT_EQ(::bind(_socket.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address), 0);
    ::setenv("NOTIFY_SOCKET", path.c_str(), 1);
  }
  ~ServiceManager() { ::unsetenv("NOTIFY_SOCKET"); }
  ServiceManager(const ServiceManager&) = delete;
  ServiceManager& operator=(const ServiceManager&) = delete;

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

using Messages = std::vector<std::string>;

TEST(KeepAliveTest, TellsTheServiceManagerWhenItBecomesBusyAndIdle) {
  const ServiceManager manager;
  KeepAlive keepAlive;
  KeepAlive::ready();
  EXPECT_EQ(manager.heard(), (Messages{"READY=1\nSTATUS=idle"}));
  keepAlive.begin();
  keepAlive.begin();
  keepAlive.end();
  EXPECT_EQ(manager.heard(), (Messages{"STATUS=busy"}));
  KeepAlive::status("2 sessions\nMAINPID=1");
  EXPECT_EQ(manager.heard(), (Messages{"STATUS=busy; 2 sessions MAINPID=1"}));
  keepAlive.end();
  KeepAlive::status({});
  KeepAlive::stopping();
  EXPECT_EQ(manager.heard(), (Messages{"STATUS=idle; 2 sessions MAINPID=1", "STATUS=idle", "STOPPING=1"}));
  EXPECT_EQ(keepAlive.begun(), 2U);
  EXPECT_EQ(keepAlive.ended(), 2U);
}

TEST(KeepAliveTest, TheLastWordIsIdleHoweverThreadsMeet) {
  const ServiceManager manager;
  KeepAlive keepAlive;
  Messages all;
  for (int round = 0; round < 20; ++round) {
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
      threads.emplace_back([&] {
        keepAlive.begin();
        keepAlive.end();
      });
    }
    for (auto& thread : threads) thread.join();
    all = manager.heard();
    ASSERT_FALSE(all.empty());
    ASSERT_EQ(all.back(), "STATUS=idle");
  }
}

TEST(KeepAliveTest, OnlyCountsWithoutAServiceManager) {
  KeepAlive keepAlive;
  keepAlive.begin();
  EXPECT_EQ(keepAlive.begun(), 1U);
  EXPECT_EQ(keepAlive.ended(), 0U);
  keepAlive.end();
  EXPECT_EQ(keepAlive.ended(), 1U);
}

}  // namespace
}  // namespace orvanta::test
