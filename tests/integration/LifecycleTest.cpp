#include <gtest/gtest.h>

#include <algorithm>
#include <csignal>
#include <filesystem>

#include "platform/codec/PropertyList.h"
#include "tests/integration/IntegrationFixture.h"

namespace orvanta::test {
namespace {

class LifecycleTest : public IntegrationFixture {
 protected:
  // The bookkeeping records (category 0) of that type that were posted.
  std::size_t records(std::int64_t type) {
    const auto all = server->events();
    return static_cast<std::size_t>(std::count_if(all.begin(), all.end(), [&](const auto& received) {
      return number(received, "_method") == 0 && number(received, "_status") == type;
    }));
  }
};

TEST_F(LifecycleTest, SessionsSendTheirStartFinishAndEnd) {
  startDaemon();
  auto session = openSession({.sessionID = 1});
  ASSERT_TRUE(session->session().blocking().finishSession());
  session.reset();
  ASSERT_TRUE(server->waitForEvents(3, kTimeout));
  EXPECT_EQ(records(0), 1U);
  EXPECT_EQ(records(2), 1U);
  EXPECT_EQ(records(1), 1U);
  EXPECT_TRUE(server->events().back().event.contains("StorebagVersion"));
}

TEST_F(LifecycleTest, SIGTERMEndsSessionsWhileTheirClientsAreConnected) {
  setSection({{"http_post", httpPost(clientSection())},
              {"dashboard", Dictionary{{"ip", "127.0.0.1"}, {"port", static_cast<int>(server->dashboardPort())}}}});
  startDaemon();
  std::vector<std::unique_ptr<OrvantaConnection>> sessions;
  for (std::uint32_t i = 0; i < 5; ++i) sessions.push_back(openSession({.sessionID = i, .batchEvent = true}));
  send(*sessions[0], event(9, 9));
  collector::PathBehaviour slow;
  slow.delay = std::chrono::milliseconds(300);
  server->setBehaviour("/events", slow);
  EXPECT_EQ(daemon->terminate(), 0) << daemon->process().allLines();
  EXPECT_EQ(records(1), 5U);
  EXPECT_EQ(clientEvents().size(), 1U) << "what was batched went out with the last flush";
  ASSERT_TRUE(server->waitForDatagrams(11, kTimeout));  // five starts, five ends, one event
  const auto datagrams = server->datagrams();
  EXPECT_EQ(std::count_if(datagrams.begin(), datagrams.end(), [](auto& d) { return d.method == 0 && d.respCode == 1; }),
            5);
}

TEST_F(LifecycleTest, SIGTERMWaitsFiveSecondsForASilentEventServer) {
  startDaemon();
  auto session = openSession({.sessionID = 1});
  server->setFault("/events", collector::ConnectionFault::silent);
  send(*session, event(9, 9));
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_EQ(daemon->terminate(), 0);
  const auto took = std::chrono::steady_clock::now() - begin;
  EXPECT_GE(took, std::chrono::seconds(5));
  EXPECT_LT(took, std::chrono::seconds(20)) << "a server may be silent for 60 s at other times";
  EXPECT_TRUE(daemon->logged("post error: Aborted: the HTTP client is shutting down", 2)) << "the event and the end";
}

TEST_F(LifecycleTest, AfterSIGKILLAStaleSocketIsReplacedAndTheDefaultsAreWhole) {
  startDaemon();
  openSession({.sessionID = 1, .clientType = 5, .requireUserInfo = true}, UserInfo{"c", "s", {}});
  daemon->process().signal(SIGKILL);
  EXPECT_EQ(daemon->process().wait(), -SIGKILL);
  EXPECT_TRUE(std::filesystem::exists(daemon->socketPath()));
  ASSERT_TRUE(daemon->start()) << daemon->process().allLines();
  EXPECT_TRUE(openSession({.sessionID = 2}));
  EXPECT_TRUE(platform::readPropertyListFile(daemon->stateDirectory() + "/com.kovalt.orvanta.plist"));
}

TEST_F(LifecycleTest, OutsideTheSandboxItRunsWithAWarningAndLeaksNothing) {
  options.sandbox = false;
  startDaemon();
  EXPECT_EQ(daemon->count("<4>main: ORVANTA_SANDBOX is off"), 1U);
  for (int i = 0; i < 20; ++i) {
    auto session = openSession({.sessionID = 1, .batchEvent = true});
    send(*session, event(1, 1));
  }
  EXPECT_EQ(daemon->terminate(), 0);  // a sanitizer that finds a leak gives another status
}

TEST_F(LifecycleTest, OrvantactlWritesDefaultsOnlyToADirectoryThatIsThere) {
  daemon = std::make_unique<DaemonProcess>(options);
  const auto write = [this](const std::string& directory) {
    return ChildProcess(program("orvantactl", {"defaults", "--state-dir", directory, "write", "environmentType", "4",
                                               "--type", "int"}))
        .wait();
  };
  EXPECT_EQ(write(daemon->stateDirectory()), 0);
  EXPECT_EQ(write(daemon->stateDirectory() + "/mistyped"), 1);
  EXPECT_FALSE(std::filesystem::exists(daemon->stateDirectory() + "/mistyped"));
  ASSERT_TRUE(daemon->start());
  openSession({.sessionID = 1});
  EXPECT_TRUE(daemon->logged("<6>userDefaultsEnvironment: Environment type 4"));
}

TEST_F(LifecycleTest, ClosedSessionsLeaveNothingBehind) {
  startDaemon();
  constexpr std::size_t kSessions = 60;
  const auto openAndClose = [this](std::size_t ended) {
    for (std::size_t i = 0; i < kSessions; ++i) openSession({.sessionID = 1});
    return daemon->logged("dealloc: OrvantadSession dealloc", ended);
  };
  // The first round also opens what is kept: connections to the event server, threads' buffers.
  ASSERT_TRUE(openAndClose(kSessions));
  const auto descriptors = daemon->descriptorCount();
  ASSERT_TRUE(openAndClose(2 * kSessions));
  ASSERT_TRUE(openAndClose(3 * kSessions));
  constexpr std::size_t kKeptAlive = 32;  // connections to the event server; what each session left would be 120
  EXPECT_TRUE(daemon->settles([this] { return daemon->descriptorCount(); }, descriptors + kKeptAlive));
  EXPECT_TRUE(daemon->settles([this] { return daemon->threadCount(); }, 8));
}

}  // namespace
}  // namespace orvanta::test
