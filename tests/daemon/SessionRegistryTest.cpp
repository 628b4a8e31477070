#include "daemon/SessionRegistry.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <thread>

#include "tests/support/SessionFixture.h"

namespace orvanta::test {
namespace {

// Groups of real sessions under the real agent. Sessions are numbered; a name such as "the child of" follows from
// levels.
class HierarchyTest : public SessionFixture {
 protected:
  HierarchyTest() {
    storebag = shared(Dictionary{
        {"http_post",
         Dictionary{{"clients", Array{Dictionary{{"post_url", "http://127.0.0.1/post"}, {"event_threshold", 49}}}}}}});
  }
  static SharedDictionary user() { return shared(Dictionary{{"clientName", "c"}, {"serviceName", "s"}}); }

  std::shared_ptr<OrvantadSession> join(std::uint32_t id, const std::string& token, std::int64_t level,
                                        SharedDictionary userInfo = user(), bool aggregates = false) {
    auto session = makeSession();
    configure(*session, id, hierarchy(token, level), std::move(userInfo), aggregates);
    return session;
  }
  std::shared_ptr<OrvantadSession> parentOf(OrvantadSession& session) {
    const std::lock_guard lock(agent.lock());
    return agent.parentSessionForChild(session);
  }
  std::shared_ptr<OrvantadSession> aggregatorOf(OrvantadSession& session) {
    const std::lock_guard lock(agent.lock());
    return agent.getAncestorWithAggregatorForSession(session);
  }
  OrvantaBackend& backend(OrvantadSession& session) { return *session.backends()->find("http_post"); }
};

TEST_F(HierarchyTest, TheFirstRegisteredSessionOfTheLevelAboveIsTheParent) {
  const auto first = join(1, "t", 1);
  const auto second = join(2, "t", 1);
  const auto child = join(3, "t", 2);
  EXPECT_EQ(parentOf(*child), first);
  configure(*first, 1, hierarchy("t", 1), user());
  EXPECT_EQ(parentOf(*child), second) << "a session that is configured again goes to the end";
}

TEST_F(HierarchyTest, QuestionsWithoutAnAnswerSayWhy) {
  const auto root = join(1, "t", 0);
  const auto orphan = join(2, "t", 2);
  EXPECT_EQ(parentOf(*root), nullptr);
  log.clear();
  EXPECT_EQ(parentOf(*orphan), nullptr);
  EXPECT_TRUE(
      log.contains("<3>parentSessionForChild: Unable to find session with hierarchy of 1 for hierarchyToken 't'"));
  EXPECT_EQ(agent.parentSessionIDStringForSession(*orphan), std::nullopt);
  EXPECT_TRUE(
      log.contains("<6>parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): "
                   "incomplete parentSessionID is ''"));
  agent.invalidated(orphan);
  log.clear();
  EXPECT_EQ(parentOf(*orphan), nullptr);
  EXPECT_TRUE(log.contains("<3>parentSessionForChild: ERROR: Session 2 not found for hierarchyToken t"));
  EXPECT_EQ(agent.parentSessionIDStringForSession(*orphan), std::nullopt);
  EXPECT_TRUE(log.contains("<6>parentSessionIDStringForSession: Session 2 not found for hierarchyToken t"));
  agent.invalidated(root);
  log.clear();
  EXPECT_EQ(parentOf(*orphan), nullptr);
  EXPECT_TRUE(log.contains("<3>parentSessionForChild: ERROR: No sessions found for hierarchyToken t"));
}

TEST_F(HierarchyTest, TheAncestryIsRootFirstAndStopsAtAGap) {
  const auto root = join(1, "t", 0);
  const auto child = join(2, "t", 1);
  const auto grandchild = join(3, "t", 2);
  const auto deepest = join(4, "t", 3);
  EXPECT_EQ(agent.parentSessionIDStringForSession(*root), std::nullopt);
  EXPECT_EQ(agent.parentSessionIDStringForSession(*deepest),
            root->sessionIDString() + "." + child->sessionIDString() + "." + grandchild->sessionIDString());
  agent.invalidated(child);
  EXPECT_EQ(agent.parentSessionIDStringForSession(*deepest), grandchild->sessionIDString());
  EXPECT_TRUE(log.contains("incomplete parentSessionID is '" + grandchild->sessionIDString() + "'"));
}

TEST_F(HierarchyTest, ASessionIsInOneGroupAtMost) {
  const auto session = join(1, "t1", 0);
  const auto child = join(2, "t1", 1);
  EXPECT_EQ(parentOf(*child), session);
  configure(*session, 1, hierarchy("t2", 0), user());
  EXPECT_EQ(parentOf(*child), nullptr);
  const auto other = join(3, "t2", 1);
  EXPECT_EQ(parentOf(*other), session);
  configure(*session, 1, {}, user());
  EXPECT_EQ(parentOf(*other), nullptr) << "configured again without a token it leaves its group";
  EXPECT_TRUE(
      log.contains("<6>updateCorrelatedSessions: Session 1 has no correlated sessions as it is a standalone session"));
}

TEST_F(HierarchyTest, LevelsThatCannotBeAreRefusedWithoutEffect) {
  const auto session = join(1, "t", 0);
  for (const std::int64_t level : {std::int64_t{2'147'483'648}, std::int64_t{4'294'967'295}, std::int64_t{-1}}) {
    Kept<> kept;
    auto info = hierarchy("t", level);
    info.set("sessionID", 99);
    session->setSessionInfo(shared(info), nullptr, nullptr, false, kept.reply());
    EXPECT_FALSE(kept.given());
    EXPECT_NE(kept.error().find("hierarchy level"), std::string::npos);
    EXPECT_EQ(session->sessionID(), 1U);
  }
  EXPECT_EQ(log.count("<4>setSessionInfo: Refused for session 1: hierarchy level"), 3U);
  configure(*session, 5, hierarchy("t", 2'147'483'647));
  EXPECT_EQ(session->sessionID(), 5U);
}

TEST_F(HierarchyTest, ATokenThatIsNoDictionaryIsNoHierarchy) {
  const auto session = makeSession();
  configure(*session, 1, Dictionary{{"hierarchyToken", "t"}});
  EXPECT_EQ(session->hierarchyToken(), std::nullopt);
  EXPECT_EQ(session->hierarchyLevel(), 0U);
}

TEST_F(HierarchyTest, TheAggregatorNearestTheRootCounts) {
  const auto root = join(1, "t", 0, user(), true);
  const auto middle = join(2, "t", 1, user(), true);
  const auto leaf = join(3, "t", 2);
  const auto anonymous = join(4, "t", 2, nullptr);
  EXPECT_EQ(aggregatorOf(*leaf), root);
  EXPECT_EQ(aggregatorOf(*root), nullptr);
  EXPECT_EQ(aggregatorOf(*anonymous), nullptr);
  EXPECT_TRUE(log.contains("<6>getAncestorWithAggregatorForSession: No user info found for session 4"));
  root->shutdownSessionAggregation();
  EXPECT_EQ(aggregatorOf(*leaf), middle);
}

TEST_F(HierarchyTest, ChildrenCarryTheChainOfIdentifiersAndFollowTheirParentsState) {
  const auto root = join(1, "t", 0);
  start(*root);
  const auto child = join(2, "t", 1);
  start(*child);
  const auto leaf = join(3, "t", 2);
  start(*leaf);
  const std::string chain = root->sessionIDString() + "." + child->sessionIDString() + "." + leaf->sessionIDString();
  EXPECT_EQ(backend(*leaf).combinedSessionIDString(), chain);
  EXPECT_EQ(backend(*root).combinedSessionIDString(), root->sessionIDString());

  backend(*root).setState(kBackendDisabled);
  backend(*root).setSamplingThreshold(0.25);
  child->syncReportingStates();
  EXPECT_EQ(backend(*child).state(), kBackendDisabled);
  EXPECT_EQ(backend(*child).samplingThreshold(), 0.25);
  EXPECT_TRUE(
      log.contains("<7>HTTPSPostBackend(syncReportingStates): http_post: state and sampling rate updated to 1, "
                   "0.25%"));
  backend(*child).setState(kBackendSampledOut);
  child->syncReportingStates();
  EXPECT_EQ(backend(*child).state(), kBackendSampledOut) << "a child that is sampled out stays so";
  backend(*root).setState(kBackendSampledOut);
  backend(*child).setState(kBackendEnabled);
  child->syncReportingStates();
  EXPECT_EQ(backend(*child).state(), kBackendSampledOut);
}

TEST_F(HierarchyTest, AChildsThresholdOutlivesItsParent) {
  const auto root = join(1, "t", 0);
  start(*root);
  const auto child = join(2, "t", 1);
  start(*child);
  backend(*root).setSamplingThreshold(0.5);
  child->syncReportingStates();
  leave(root);
  log.clear();
  child->syncReportingStates();
  EXPECT_EQ(backend(*child).samplingThreshold(), 0.5);
  EXPECT_TRUE(log.contains(
      "<6>syncReportingStates: child session 2 (backend http_post) with hierarchy 1 is missing its parent"));
}

TEST_F(HierarchyTest, ABackendThatTheParentLacksIsDisabled) {
  const auto root = join(1, "t", 0);
  storebag = shared(Dictionary{{"voltmark", Dictionary{}}});
  maxAge = 0;
  start(*root);
  storebag =
      shared(Dictionary{{"http_post", Dictionary{{"clients", Array{Dictionary{{"post_url", "http://127.0.0.1/"}}}}}},
                        {"voltmark", Dictionary{}}});
  device.clock.advance(1);
  const auto child = join(2, "t", 1);
  EXPECT_EQ(start(*child), (std::vector<std::string>{"voltmark"}));
  EXPECT_EQ(backend(*child).state(), kBackendDisabled);
}

TEST_F(HierarchyTest, NewUserInfoOfTheRootReachesTheSessionsBelow) {
  const auto root = join(1, "t", 0);
  const auto child = join(2, "t", 1);
  start(*child);
  start(*root);
  backend(*child).setState(kBackendDisabled);
  log.clear();
  root->fetchStatesWithUserInfo(shared(Dictionary{{"clientName", "other"}, {"serviceName", "s"}}), {});
  EXPECT_TRUE(log.contains("<7>receivedUserInfo: Received new user info for session 1"));
  EXPECT_TRUE(log.contains(
      "<7>updateDownstreamSessions: Updating combined session ID and syncing reporting states for session 2"));
  EXPECT_EQ(backend(*child).state(), kBackendEnabled);
  log.clear();
  root->fetchStatesWithUserInfo(shared(Dictionary{{"clientName", "other"}, {"serviceName", "s"}, {"more", 1}}), {});
  EXPECT_FALSE(log.contains("updateDownstreamSessions")) << "the same names are no news";
}

TEST_F(HierarchyTest, EventsReachOneAggregatorAndTheDeeperOnesAreToldThatTheyEnd) {
  const auto leaf = join(3, "t", 2, user(), true);
  start(*leaf);
  const auto leafClient = connections.back();
  const auto root = join(1, "t", 0, user(), true);
  const auto rootClient = connections.back();
  start(*root);
  ASSERT_FALSE(leafClient->aggregated().empty());
  EXPECT_TRUE(leafClient->aggregated().back().isEndNotice());
  EXPECT_FALSE(leaf->hasAggregator());
  const auto before = leafClient->aggregated().size();

  send(*leaf, {{"category", 5}, {"type", 6}, {"payload", Dictionary{{"clientName", "mine"}, {"x", 1}}}});
  EXPECT_EQ(leafClient->aggregated().size(), before);
  const auto event = rootClient->aggregated().back();
  EXPECT_EQ(event.category, 5);
  EXPECT_EQ(*event.payload, (Dictionary{{"clientName", "c"}, {"serviceName", "s"}, {"x", 1}}));
  EXPECT_EQ(event.sessionInfo->find("sessionID")->integerValue(), 3);
  send(*leaf, {{"category", 5}, {"type", 7}});
  EXPECT_FALSE(rootClient->aggregated().back().payload) << "no payload stays none";

  const auto total = rootClient->aggregated().size();
  root->shutdownSessionAggregation();
  root->shutdownSessionAggregation();
  ASSERT_EQ(rootClient->aggregated().size(), total + 1) << "one end notice";
  send(*leaf, {{"category", 5}, {"type", 8}});
  EXPECT_EQ(rootClient->aggregated().size(), total + 1);
}

TEST_F(HierarchyTest, WhoeverHasNobodyAboveNeverWaitsForAnothersStorebag) {
  maxAge = 0;
  const auto root = join(1, "t", 0, user(), true);
  const auto rootClient = connections.back();
  const auto anonymous = join(2, "t", 1, nullptr);
  const auto standalone = makeSession();
  configure(*standalone, 3);
  for (const auto& session : {root, anonymous, standalone}) start(*session);
  const auto fetching = makeSession();
  configure(*fetching, 4);
  std::promise<void> begun, release;
  std::atomic<bool> overdue{false};
  whileFetching = [&] {
    begun.set_value();
    overdue = release.get_future().wait_for(std::chrono::seconds(30)) != std::future_status::ready;
  };
  std::thread fetcher([&] { start(*fetching); });
  begun.get_future().wait();
  log.clear();
  for (int i = 0; i < 10; ++i) {
    for (const auto& session : {root, anonymous, standalone}) send(*session, {{"category", 5}, {"type", i}});
  }
  // Coming and going wait for nobody either.
  const auto visitor = makeSession();
  configure(*visitor, 5);
  leave(visitor);
  EXPECT_FALSE(overdue);
  release.set_value();
  fetcher.join();
  for (const int id : {2, 3}) {
    EXPECT_EQ(log.count(fmt::format("<6>getAncestorWithAggregatorForSession: No user info found for session {}", id)),
              10U);
  }
  EXPECT_EQ(rootClient->aggregated().back().type, 9);
}

TEST_F(HierarchyTest, AThousandSessionsOfOneGroupJoinAndLeave) {
  std::vector<std::shared_ptr<OrvantadSession>> sessions;
  platform::setLogLevel(platform::LogLevel::error);
  for (std::uint32_t i = 0; i < 1000; ++i) sessions.push_back(join(i, "big", i % 4));
  EXPECT_EQ(parentOf(*sessions[999]), sessions[2]);
  for (std::uint32_t i = 0; i < 998; ++i) agent.invalidated(sessions[i]);
  EXPECT_EQ(parentOf(*sessions[999]), sessions[998]);
}

}  // namespace
}  // namespace orvanta::test
