#include <gtest/gtest.h>

#include <vector>

#include "tests/integration/IntegrationFixture.h"

namespace orvanta::test {
namespace {

class RelatedSessionsTest : public IntegrationFixture {
 protected:
  // A session in a process of its own (see MemberProgram.cpp), which tells what happens to it.
  std::unique_ptr<ChildProcess> launch(std::uint32_t id, const std::string& token, std::uint32_t level,
                                       bool aggregates) {
    auto options = program("member_program",
                           {std::to_string(id), token, std::to_string(level), aggregates ? "aggregates" : "sends"});
    options.holdInput = true;
    auto member = std::make_unique<ChildProcess>(std::move(options));
    EXPECT_TRUE(member->waitForLine("joined")) << member->allLines();
    return member;
  }
  static void tell(ChildProcess& program, int number) {
    program.write(std::to_string(number) + "\n");
    EXPECT_TRUE(program.waitForLine("sent " + std::to_string(number))) << program.allLines();
  }
  static std::vector<std::string> receivedBy(ChildProcess& program) {
    auto lines = program.lines();
    std::erase_if(lines, [](const std::string& line) { return line.find("received 20/") != 0; });
    return lines;
  }
  std::string postedSessionID(std::int64_t marker) {
    for (const auto& received : clientEvents()) {
      if (number(received, "marker") == marker) return received.event.find("_sessionID")->description();
    }
    return "none";
  }
};

TEST_F(RelatedSessionsTest, FiveProgramsFollowTheirHierarchy) {
  startDaemon();
  const auto root = launch(1, "call", 0, true);
  const auto left = launch(2, "call", 1, false);
  const auto right = launch(3, "call", 1, false);
  const auto stranger = launch(9, "other", 1, false);
  const auto leaf = launch(4, "call", 2, true);
  EXPECT_TRUE(leaf->waitForLine("end")) << "the root's aggregation takes precedence";

  int marker = 100;
  for (auto* program : {root.get(), left.get(), right.get(), stranger.get(), leaf.get()}) tell(*program, marker++);
  ASSERT_TRUE(waitForClientEvents(5));
  const std::string rootID = postedSessionID(100), leftID = postedSessionID(101), rightID = postedSessionID(102);
  constexpr std::size_t kOwn = 24;  // of each session's own identifier
  ASSERT_EQ(rootID.size(), kOwn);
  EXPECT_EQ(leftID.substr(0, kOwn + 1), rootID + ".");
  EXPECT_EQ(rightID.substr(0, kOwn + 1), rootID + ".");
  EXPECT_EQ(rightID.size(), 2 * kOwn + 1);
  EXPECT_NE(leftID, rightID);
  EXPECT_EQ(postedSessionID(103).size(), kOwn) << "its parent is missing";
  EXPECT_EQ(postedSessionID(104).substr(0, 2 * kOwn + 2), leftID + ".") << "the first of level 1 is the parent";
  EXPECT_EQ(postedSessionID(104).size(), 3 * kOwn + 2);

  // The root hears events in the order in which they were sent: with the last one all have come.
  ASSERT_TRUE(root->waitForLine("received 20/4 marker 104 who 4 from 4")) << root->allLines();
  EXPECT_EQ(receivedBy(*root), (std::vector<std::string>{
                                   "received 20/1 marker 100 who 1 from 1", "received 20/2 marker 101 who 2 from 2",
                                   "received 20/3 marker 102 who 3 from 3", "received 20/4 marker 104 who 4 from 4"}));
  EXPECT_EQ(root->count("end"), 0U);

  // A program that leaves says so to the root: its last event is the session's own.
  right->closeInput();
  EXPECT_EQ(right->wait(), 0) << right->allLines();
  EXPECT_TRUE(root->waitForLine("received 0/1 marker none who 3 from 3")) << root->allLines();

  EXPECT_EQ(daemon->terminate(), 0);
  EXPECT_TRUE(root->waitForLine("end")) << "the root is told before its connection goes";
  for (const auto* program : {&root, &left, &stranger, &leaf}) (*program)->wait();
  EXPECT_EQ(root->count("end"), 1U);
  EXPECT_EQ(leaf->count("end"), 1U);
  EXPECT_EQ(leaf->count("received"), 0U) << leaf->allLines();
  EXPECT_EQ(stranger->count("received"), 0U);
}

TEST_F(RelatedSessionsTest, WatchPrintsTheEventsOfItsHierarchyAsJSONLines) {
  startDaemon();
  auto watching = program("orvantactl", {"watch", "--token", "call", "--level", "0", "--client-type", "5"});
  watching.keepOutput = true;
  ChildProcess watcher(std::move(watching));
  ASSERT_TRUE(daemon->logged("updateCorrelatedSessions: Adding session"));
  SessionInfo info{.sessionID = 2};
  info.hierarchyToken = HierarchyToken{"call", 1};
  auto child = openSession(info, UserInfo{"client", "service", {}});
  send(*child, event(20, 7, {{"marker", 1}}));
  child.reset();
  ASSERT_TRUE(daemon->logged("dealloc: OrvantadSession dealloc: 2"));
  EXPECT_EQ(daemon->terminate(), 0);
  EXPECT_EQ(watcher.wait(), 0) << "the end notice decides, not the closing of the connection after it";
  const std::string output = watcher.output();
  EXPECT_NE(output.find("\"marker\":1"), std::string::npos) << output << watcher.allLines();
}

}  // namespace
}  // namespace orvanta::test
