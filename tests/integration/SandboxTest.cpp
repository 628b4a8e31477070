#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>

#include "tests/integration/IntegrationFixture.h"
#include "tests/support/ForbiddenActs.h"

namespace orvanta::test {
namespace {

namespace fs = std::filesystem;

// The daemon with a plug-in that tries what it must not be able to do.
class SandboxTest : public IntegrationFixture {
 protected:
  void SetUp() override {
    IntegrationFixture::SetUp();
    setSection({{"brisk", Dictionary{}}});
    options.environment["ORVANTA_PLUGINS"] = INTRUDER_PLUGINS;
  }
  MessageParameters act(std::size_t number, std::uint16_t thread) {
    return event(static_cast<std::uint16_t>(number + 1), thread, {{"try", true}});
  }
};

TEST_F(SandboxTest, OnEveryThreadForbiddenActsFailAndAreLoggedOnce) {
  // The kernel's Landlock, and the one that first counts.
  for (const std::int64_t abi : {1000, 2}) {
    options.landlockAbi = abi;
    startDaemon();
    auto session = openSession({.sessionID = 1, .clientType = 7});
    std::string expected;
    for (std::size_t number = 0; number < std::size(kForbiddenActs); ++number) {
      if (kForbiddenActs[number].result == nullptr) continue;
      for (const std::uint16_t thread : {0, 1}) {
        send(*session, act(number, thread));
        expected += std::string(kForbiddenActs[number].name) + ": " + kForbiddenActs[number].result + "\n";
      }
    }
    EXPECT_EQ(daemon->stateFile("acts.log"), expected);
    EXPECT_TRUE(daemon->logged("<4>sandbox: Refused system call inotify_init1"));
    EXPECT_EQ(daemon->count("inotify_init1"), 1U);
#if !defined(__SANITIZE_THREAD__)  // whose own thread is there before the sandbox
    // Whatever thread there is, is filtered.
    for (const auto& task : fs::directory_iterator("/proc/" + std::to_string(daemon->process().pid()) + "/task")) {
      std::stringstream status;
      status << std::ifstream(task.path() / "status").rdbuf();
      EXPECT_NE(status.str().find("\nSeccomp:\t2\n"), std::string::npos) << status.str();
      EXPECT_NE(status.str().find("\nNoNewPrivs:\t1\n"), std::string::npos) << status.str();
    }
#endif
    session.reset();
    EXPECT_EQ(daemon->terminate(), 0);
  }
}

TEST_F(SandboxTest, ActsThatOnlyAnIntruderTriesEndTheDaemon) {
  for (std::size_t run = 0; run < 2 * std::size(kForbiddenActs); ++run) {
    const std::size_t number = run / 2;
    if (kForbiddenActs[number].result != nullptr) continue;
    options.landlockAbi = run % 2 == 0 ? 1000 : 2;
    daemon = std::make_unique<DaemonProcess>(options);
    ASSERT_TRUE(daemon->start()) << daemon->process().allLines();
    auto session = openSession({.sessionID = 1, .clientType = 7});
    const std::uint16_t thread = (number + run) % 2;
    EXPECT_FALSE(session->session().blocking().sendMessage(act(number, thread))) << kForbiddenActs[number].name;
    EXPECT_EQ(daemon->process().wait(), -SIGSYS) << kForbiddenActs[number].name;
  }
}

TEST_F(SandboxTest, APlugInThatNeverReturnsNeitherHoldsUpOthersNorTheEnd) {
  startDaemon();
  auto stuck = openSession({.sessionID = 1, .clientType = 7});
  stuck->session().sendMessageWithCategory(kActThatNeverEnds, 0, nullptr, {});
  auto other = openSession({.sessionID = 2, .clientType = 7});
  send(*other, act(0, 0));
  EXPECT_EQ(daemon->terminate(), 0);
  EXPECT_EQ(daemon->count("<3>main: 1 sessions are still busy and are left behind"), 1U);
}

TEST_F(SandboxTest, AKernelWithoutLandlockIsAFailureThatSaysWhatToDo) {
  options.wrapper = WITHOUT_LANDLOCK;
  daemon = std::make_unique<DaemonProcess>(options);
  EXPECT_FALSE(daemon->start());
  EXPECT_EQ(daemon->process().wait(), 255);
  EXPECT_TRUE(daemon->logged(
      "<3>main: Failed to enter sandbox com.kovalt.orvantad: sandbox profile com.kovalt.orvantad: the kernel has no "
      "Landlock (Function not implemented): use a kernel with CONFIG_SECURITY_LANDLOCK, booted with \"landlock\" in "
      "its "
      "lsm= list, or run without a sandbox by ORVANTA_SANDBOX=off"))
      << daemon->process().allLines();
  options.sandbox = false;
  startDaemon();
  EXPECT_EQ(daemon->count("<4>main: ORVANTA_SANDBOX is off"), 1U);
  EXPECT_TRUE(openSession({.sessionID = 1, .clientType = 7}));
}

}  // namespace
}  // namespace orvanta::test
