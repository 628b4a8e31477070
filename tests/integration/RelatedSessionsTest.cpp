#include <gtest/gtest.h>

#include <condition_variable>
#include <mutex>

#include "tests/integration/IntegrationFixture.h"

namespace orvanta::test {
namespace {

// Programs of one hierarchy, each with a connection of its own.
class RelatedSessionsTest : public IntegrationFixture {
 protected:
  struct Program {
    std::unique_ptr<OrvantaConnection> connection;
    std::mutex mutex;
    std::condition_variable changed;
    std::vector<AggregatedEvent> events;  // guarded by mutex
    int endings = 0;                      // guarded by mutex

    bool waitFor(const std::function<bool()>& condition) {
      std::unique_lock lock(mutex);
      return changed.wait_for(lock, kPatience, condition);
    }
  };

  std::unique_ptr<Program> join(std::uint32_t id, const std::string& token, std::uint32_t level, bool aggregates) {
    auto program = std::make_unique<Program>();
    program->connection = connect();
    auto& session = program->connection->session();
    if (aggregates) {
      auto* p = program.get();
      session.setAggregationHandler(
          [p](const AggregatedEvent& event) {
            const std::lock_guard lock(p->mutex);
            p->events.push_back(event);
            p->changed.notify_all();
          },
          [p] {
            const std::lock_guard lock(p->mutex);
            ++p->endings;
            p->changed.notify_all();
          });
    }
    SessionInfo info{.sessionID = id, .clientType = 5, .requireUserInfo = true};
    info.hierarchyToken = HierarchyToken{token, level};
    UserInfo user{"client", "service", {{"who", std::int64_t(id)}}};
    EXPECT_TRUE(session.blocking().configure(info, user));
    return program;
  }
  std::string postedSessionID(std::int64_t marker) {
    for (const auto& received : clientEvents()) {
      const Value* found = received.event.find("marker");
      if (found != nullptr && found->integerValue() == marker) return received.event.find("_sessionID")->description();
    }
    return "none";
  }
};

TEST_F(RelatedSessionsTest, FiveProgramsFollowTheirHierarchy) {
  startDaemon();
  auto root = join(1, "call", 0, true);
  auto left = join(2, "call", 1, false);
  auto right = join(3, "call", 1, false);
  auto stranger = join(9, "other", 1, false);
  auto leaf = join(4, "call", 2, true);
  // The root's aggregation takes precedence: the leaf's own ends at its first evaluation.
  ASSERT_TRUE(leaf->waitFor([&] { return leaf->endings == 1; }));

  std::int64_t marker = 100;
  for (auto* program : {root.get(), left.get(), right.get(), stranger.get(), leaf.get()}) {
    send(*program->connection, event(20, 1, {{"marker", marker++}}));
  }
  ASSERT_TRUE(waitForClientEvents(5));
  const auto dots = [](const std::string& text) { return std::count(text.begin(), text.end(), '.'); };
  const std::string rootID = postedSessionID(100);
  EXPECT_EQ(dots(rootID), 0);
  EXPECT_EQ(postedSessionID(101).find(rootID + "."), 0U);
  EXPECT_EQ(postedSessionID(102).find(rootID + "."), 0U);
  EXPECT_EQ(dots(postedSessionID(103)), 0) << "its parent is missing";
  EXPECT_EQ(postedSessionID(104).find(postedSessionID(101) + "."), 0U) << "the first of level 1 is the parent";

  ASSERT_TRUE(root->waitFor([&] {
    std::size_t own = 0;
    for (const auto& received : root->events) own += received.category == 20 ? 1 : 0;
    return own >= 4;
  }));
  std::vector<std::int64_t> markers;
  {
    const std::lock_guard lock(root->mutex);
    for (const auto& received : root->events) {
      if (received.category != 20) continue;
      markers.push_back(received.payload->find("marker")->integerValue());
      EXPECT_EQ(received.payload->find("who")->integerValue(), received.sessionInfo->find("sessionID")->integerValue());
    }
  }
  EXPECT_EQ(markers, (std::vector<std::int64_t>{100, 101, 102, 104}));

  const auto leafEvents = leaf->events.size();
  send(*leaf->connection, event(20, 2));
  EXPECT_EQ(leaf->events.size(), leafEvents);
  EXPECT_EQ(daemon->terminate(), 0);
  EXPECT_TRUE(root->waitFor([&] { return root->endings == 1; })) << "the root is told before its connection goes";
  EXPECT_EQ(leaf->endings, 1);
}

TEST_F(RelatedSessionsTest, AParentThatLeavesAndReturnsIsFollowedAgain) {
  startDaemon();
  auto root = join(1, "t", 0, false);
  auto child = join(2, "t", 1, false);
  root.reset();
  ASSERT_TRUE(daemon->logged("dealloc: OrvantadSession dealloc: 1"));
  ASSERT_TRUE(child->connection->session().blocking().fetchStates(UserInfo{"client", "else", {}}.dictionary()));
  EXPECT_TRUE(daemon->logged(
      "<6>syncReportingStates: child session 2 (backend http_post) with hierarchy 1 is missing its parent"));
  root = join(3, "t", 0, false);
  EXPECT_TRUE(daemon->logged(
      "<7>updateDownstreamSessions: Updating combined session ID and syncing reporting states for session 2"));
  send(*child->connection, event(20, 1, {{"marker", 1}}));
  send(*root->connection, event(20, 1, {{"marker", 2}}));
  ASSERT_TRUE(waitForClientEvents(2));
  EXPECT_EQ(postedSessionID(1).find(postedSessionID(2) + "."), 0U);
}

TEST_F(RelatedSessionsTest, WatchPrintsTheEventsOfItsHierarchyAsJSONLines) {
  startDaemon();
  ChildProcess::Options watching;
  watching.program = DaemonProcess::programPath("orvantactl");
  watching.arguments = {"watch", "--token", "call", "--level", "0", "--client-type", "5"};
  watching.environment = daemon->environment();
  watching.keepOutput = true;
  ChildProcess watcher(std::move(watching));
  ASSERT_TRUE(daemon->logged("updateCorrelatedSessions: Adding session"));
  auto child = join(2, "call", 1, false);
  send(*child->connection, event(20, 7, {{"marker", 1}}));
  child.reset();
  ASSERT_TRUE(daemon->logged("dealloc: OrvantadSession dealloc: 2"));
  EXPECT_EQ(daemon->terminate(), 0);
  const std::string output = watcher.output();
  EXPECT_NE(output.find("\"marker\":1"), std::string::npos) << output << watcher.allLines();
}

}  // namespace
}  // namespace orvanta::test
