#include "platform/host/KeepAlive.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "tests/support/ServiceManager.h"
#include "tests/support/Threads.h"

namespace orvanta::test {
namespace {

using platform::KeepAlive;

using Messages = std::vector<std::string>;

TEST(KeepAliveTest, TellsTheServiceManagerWhenItBecomesBusyAndIdle) {
  const ServiceManager manager;
  manager.setEnvironment();
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
  KeepAlive::stopping();
  EXPECT_EQ(manager.heard(), (Messages{"STATUS=idle", "STOPPING=1"}));
}

TEST(KeepAliveTest, TheLastWordIsIdleHoweverThreadsMeet) {
  const ServiceManager manager;
  manager.setEnvironment();
  KeepAlive keepAlive;
  for (int round = 0; round < 20; ++round) {
    inThreads(4, [&](int) {
      keepAlive.begin();
      keepAlive.end();
    });
    ASSERT_EQ(manager.heard().back(), "STATUS=idle");
  }
}

}  // namespace
}  // namespace orvanta::test
