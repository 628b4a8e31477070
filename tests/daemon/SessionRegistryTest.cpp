#include "daemon/SessionRegistry.h"

#include <gtest/gtest.h>

#include "tests/support/SessionFixture.h"

namespace orvanta::test {
namespace {

// Groups of real sessions under the real agent.
class HierarchyTest : public SessionFixture {
 protected:
  using Session = std::shared_ptr<OrvantadSession>;
  const Dictionary clients{
      {"clients", Array{Dictionary{{"post_url", "http://127.0.0.1/post"}, {"event_threshold", 49}}}}};

  HierarchyTest() { storebag = shared({{"http_post", clients}}); }
  static SharedDictionary user() { return shared(Dictionary{{"clientName", "c"}, {"serviceName", "s"}}); }

  Session join(std::uint32_t id, const std::string& token, std::int64_t level, SharedDictionary userInfo = user(),
               bool aggregates = false) {
    auto session = makeSession();
    configure(*session, id, hierarchy(token, level), std::move(userInfo), aggregates);
    return session;
  }
  Session started(std::uint32_t id, std::int64_t level) {
    auto session = join(id, "t", level);
    start(*session);
    return session;
  }
  Session parentOf(OrvantadSession& session) {
    const AgentLock::Held lock(agent.lock());
    return agent.parentSessionForChild(session);
  }
  Session aggregatorOf(OrvantadSession& session) {
    const AgentLock::Held lock(agent.lock());
    return agent.getAncestorWithAggregatorForSession(session);
  }
  OrvantaBackend& backend(OrvantadSession& session) { return *session.backends()->find("http_post"); }
};

TEST_F(HierarchyTest, QuestionsWithoutAnAnswerSayWhy) {
  const auto root = join(1, "t", 0);
  const auto orphan = join(2, "t", 2);
  const auto hasNoParent = [&](const std::string& line) {
    log.clear();
    EXPECT_EQ(parentOf(*orphan), nullptr);
    EXPECT_TRUE(log.contains("<3>parentSessionForChild: " + line)) << line;
  };
  const auto hasNoAncestry = [&](const std::string& line) {
    EXPECT_EQ(agent.parentSessionIDStringForSession(*orphan), std::nullopt);
    EXPECT_TRUE(log.contains("<6>parentSessionIDStringForSession: " + line)) << line;
  };
  EXPECT_EQ(parentOf(*root), nullptr);
  hasNoParent("Unable to find session with hierarchy of 1 for hierarchyToken 't'");
  hasNoAncestry("Found a gap in hierarchy (one of parents missing): incomplete parentSessionID is ''");
  const auto below = join(3, "t", 3);
  EXPECT_EQ(agent.parentSessionIDStringForSession(*below), orphan->sessionIDString()) << "up to the gap";
  EXPECT_TRUE(log.contains("incomplete parentSessionID is '" + orphan->sessionIDString() + "'"));
  agent.invalidated(below);
  agent.invalidated(orphan);
  hasNoParent("ERROR: Session 2 not found for hierarchyToken t");
  hasNoAncestry("Session 2 not found for hierarchyToken t");
  agent.invalidated(root);
  hasNoParent("ERROR: No sessions found for hierarchyToken t");
}

TEST_F(HierarchyTest, TheFirstRegisteredOfTheLevelAboveIsTheParentAndNoSessionIsInTwoGroups) {
  const auto first = join(1, "t", 1);
  const auto second = join(2, "t", 1);
  const auto child = join(3, "t", 2);
  EXPECT_EQ(parentOf(*child), first);
  configure(*first, 1, hierarchy("t", 1), user());
  EXPECT_EQ(parentOf(*child), second) << "a session that is configured again goes to the end";
  configure(*second, 2, hierarchy("t2", 1), user());
  EXPECT_EQ(parentOf(*child), first);
  const auto other = join(4, "t2", 2);
  EXPECT_EQ(parentOf(*other), second);
  configure(*second, 2, {}, user());
  EXPECT_EQ(parentOf(*other), nullptr) << "configured again without a token it leaves its group";
  EXPECT_TRUE(
      log.contains("<6>updateCorrelatedSessions: Session 2 has no correlated sessions as it is a standalone session"));
}

TEST_F(HierarchyTest, LevelsThatCannotBeAreRefusedWithoutEffect) {
  const auto session = join(1, "t", 0);
  for (const std::int64_t level : {2'147'483'648, 4'294'967'295, std::int64_t{-1}}) {
    Kept<> kept;
    auto info = hierarchy("t", level);
    info.set("sessionID", 99);
    session->setSessionInfo(shared(info), nullptr, nullptr, false, kept.reply());
    EXPECT_NE(kept.error().find("hierarchy level"), std::string::npos);
    EXPECT_EQ(session->sessionID(), 1U);
  }
  EXPECT_EQ(log.count("<4>setSessionInfo: Refused for session 1: hierarchy level"), 3U);
  configure(*session, 5, hierarchy("t", 2'147'483'647));
  EXPECT_EQ(session->sessionID(), 5U);
  const auto standalone = makeSession();
  configure(*standalone, 1, Dictionary{{"hierarchyToken", "t"}});
  EXPECT_EQ(standalone->hierarchyToken(), std::nullopt) << "no dictionary, no hierarchy";
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
  const auto root = started(1, 0);
  const auto child = started(2, 1);
  const auto leaf = started(3, 2);
  const std::string chain = root->sessionIDString() + "." + child->sessionIDString() + "." + leaf->sessionIDString();
  EXPECT_EQ(backend(*leaf).combinedSessionIDString(), chain);
  EXPECT_EQ(backend(*root).combinedSessionIDString(), root->sessionIDString());

  const auto stateAfterSync = [&](BackendState parents, BackendState childs) {
    backend(*root).setState(parents);
    backend(*child).setState(childs);
    child->syncReportingStates();
    return backend(*child).state();
  };
  backend(*root).setSamplingThreshold(0.25);
  EXPECT_EQ(stateAfterSync(kBackendDisabled, kBackendEnabled), kBackendDisabled);
  EXPECT_EQ(backend(*child).samplingThreshold(), 0.25);
  EXPECT_TRUE(
      log.contains("<7>HTTPSPostBackend(syncReportingStates): http_post: state and sampling rate updated to 1, "
                   "0.25%"));
  EXPECT_EQ(stateAfterSync(kBackendDisabled, kBackendHeld), kBackendHeld) << "one sampled out stays so";
  EXPECT_EQ(stateAfterSync(kBackendHeld, kBackendEnabled), kBackendHeld);

  leave(root);
  child->syncReportingStates();
  EXPECT_EQ(backend(*child).samplingThreshold(), 0.25) << "the threshold outlives the parent";
  EXPECT_TRUE(log.contains(
      "<6>syncReportingStates: child session 2 (backend http_post) with hierarchy 1 is missing its parent"));
  const auto returned = started(4, 0);
  EXPECT_EQ(backend(*child).combinedSessionIDString(), returned->sessionIDString() + "." + child->sessionIDString());
}

TEST_F(HierarchyTest, ABackendThatTheParentLacksIsDisabled) {
  maxAge = 0;
  storebag = shared({{"voltmark", Dictionary{}}});
  const auto root = started(1, 0);
  storebag = shared({{"http_post", clients}, {"voltmark", Dictionary{}}});
  const auto child = join(2, "t", 1);
  EXPECT_EQ(start(*child), (std::vector<std::string>{"voltmark"}));
  EXPECT_EQ(backend(*child).state(), kBackendDisabled);
}

TEST_F(HierarchyTest, NewUserInfoOfTheRootReachesTheSessionsBelow) {
  const auto root = join(1, "t", 0);
  const auto child = started(2, 1);
  start(*root);
  backend(*child).setState(kBackendDisabled);
  Dictionary info{{"clientName", "other"}, {"serviceName", "s"}};
  log.clear();
  root->fetchStatesWithUserInfo(shared(info), {});
  EXPECT_TRUE(log.contains("<7>receivedUserInfo: Received new user info for session 1"));
  EXPECT_TRUE(log.contains(
      "<7>updateDownstreamSessions: Updating combined session ID and syncing reporting states for session 2"));
  EXPECT_EQ(backend(*child).state(), kBackendEnabled);
  log.clear();
  info.set("more", 1);
  root->fetchStatesWithUserInfo(shared(info), {});
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
  EXPECT_FALSE(rootClient->aggregated().back().payload) << "no payload stays null";

  const auto total = rootClient->aggregated().size();
  root->shutdownSessionAggregation();
  root->shutdownSessionAggregation();
  ASSERT_EQ(rootClient->aggregated().size(), total + 1) << "one end notice";
  send(*leaf, {{"category", 5}, {"type", 8}});
  EXPECT_EQ(rootClient->aggregated().size(), total + 1);
}

}  // namespace
}  // namespace orvanta::test
