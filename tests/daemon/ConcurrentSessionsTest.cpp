#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <future>
#include <random>
#include <thread>
#include <utility>

#include "interface/OrvantaConstants.h"
#include "platform/PropertyList.h"
#include "tests/platform/Waiting.h"
#include "tests/support/SessionFixture.h"

namespace orvanta::test {
namespace {

SharedDictionary httpsStorebag() {
  return shared(Dictionary{{"http_post", Dictionary{{"clients", Array{Dictionary{{"post_url", "http://127.0.0.1/post"},
                                                                                 {"event_threshold", 5}}}}}}});
}

// The agent's storebag server keeps silent until the test has had enough.
class SilentServerTest : public ::testing::Test {
 protected:
  ~SilentServerTest() override {
    release();
    _waiting.wait();
    device.get().pool().drain(kHangGuard);
  }
  // A session that holds the agent's lock from now on, waiting for its storebag.
  void beginFetch() {
    _fetching = OrvantadSession::create(device, agent, nullptr);
    _fetching->setSessionInfo(shared(Dictionary{{"sessionID", 1}, {"clientType", 5}}), nullptr, nullptr, false, {});
    _waiting = std::async(std::launch::async, [this] {
      _fetching->startConfigWithCompletionHandler({});
      _fetching->end();
    });
    ASSERT_TRUE(_asked.waitFor(1));
  }
  // Whether the step comes to its end though the fetch does not.
  template <class Step>
  bool passes(Step step) {
    auto done = std::async(std::launch::async, step);
    const bool passed = done.wait_for(kHangGuard) == std::future_status::ready;
    if (!passed) release();
    return passed;
  }
  void release() { _release.add(); }

  LogCapture log{platform::LogLevel::error};
  TestPlatform device;
  OrvantadAgent agent{device, [this](std::int32_t, StorebagFetch&) {
                        _asked.add();
                        _release.waitFor(1);
                        return httpsStorebag();
                      }};

 private:
  Counter _asked;
  Counter _release;
  std::shared_ptr<OrvantadSession> _fetching;
  std::future<void> _waiting;
};

TEST_F(SilentServerTest, AdmissionAndSessionsOutsideGroupsDoNotWaitForIt) {
  std::filesystem::create_directory(device.directory / "etc/entitlements.d");
  device.directory.write("etc/entitlements.d/all.plist",
                         *platform::writeXmlPropertyList(
                             Dictionary{{"user", std::to_string(::getuid())},
                                        {"entitlements", Dictionary{{std::string(kOrvantaEntitlement), true}}}}));
  const auto related = OrvantadSession::create(device, agent, nullptr);
  related->setSessionInfo(
      shared(Dictionary{{"sessionID", 4}, {"hierarchyToken", Dictionary{{"tokenID", "t"}, {"level", 0}}}}), nullptr,
      nullptr, false, {});
  beginFetch();
  // One that is in a group waits for the agent, but with no other lock in its hands.
  const auto leaving = std::async(std::launch::async, [&] {
    agent.invalidated(related);
    related->end();
  });
  // Remembers whom it was given, and plays the peer that comes and goes.
  struct Peer final : public RecordingConnection {
    using RecordingConnection::RecordingConnection;
    void resume(std::shared_ptr<platform::ConnectionDelegate> given) override { delegate = std::move(given); }
    std::shared_ptr<platform::ConnectionDelegate> delegate;
  };
  EXPECT_TRUE(passes([this] {
    const auto peer = std::make_shared<Peer>(device.get().pool());
    platform::PeerIdentity identity;
    identity.uid = ::getuid();
    EXPECT_TRUE(agent.listenerShouldAcceptNewConnection({peer, identity}));
    platform::Frame call;
    call.kind = platform::Frame::Kind::request;
    call.method = "setSessionInfo";
    call.params = Array{Dictionary{{"sessionID", 2}, {"clientType", 7}}, nullptr, nullptr, true};
    peer->delegate->received(std::move(call));
    call = {};
    call.kind = platform::Frame::Kind::request;
    call.method = "sendMessageWithDictionary";
    call.params = Array{Dictionary{{"category", 1}, {"type", 2}}};
    peer->delegate->received(std::move(call));
    std::exchange(peer->delegate, nullptr)->invalidated(std::nullopt);
  }));
  EXPECT_TRUE(passes([this] { EXPECT_EQ(agent.sessionCount(), 0U); }));
  release();
}

TEST_F(SilentServerTest, SessionsThatWaitForTheAgentLeaveTheThreadsOfThePoolToOthers) {
  beginFetch();
  Counter waiting;
  std::vector<std::shared_ptr<OrvantadSession>> sessions;
  for (std::uint32_t i = 0; i < 8; ++i) {
    sessions.push_back(OrvantadSession::create(device, agent, nullptr));
    device.get().pool().post([&, session = sessions.back()] {
      waiting.add();
      session->setSessionInfo(
          shared(Dictionary{{"sessionID", 3}, {"hierarchyToken", Dictionary{{"tokenID", "t"}, {"level", 0}}}}), nullptr,
          nullptr, false, {});
      agent.invalidated(session);
      session->end();
    });
  }
  EXPECT_TRUE(passes([&] {
    EXPECT_TRUE(waiting.waitFor(8)) << "they hold every thread";
    Counter ran;
    device.get().pool().post([&] { ran.add(); });
    EXPECT_TRUE(ran.waitFor(1));
  }));
}

// Sessions of one group, each on a thread of its own: they change places, configure, send, aggregate and leave.
class RelatedSessionsStressTest : public SessionFixture {};

TEST_F(RelatedSessionsStressTest, EverythingAtOnce) {
  storebag = httpsStorebag();
  platform::setLogLevel(platform::LogLevel::error);
  const SharedDictionary users[] = {shared(Dictionary{{"clientName", "a"}, {"serviceName", "s"}}),
                                    shared(Dictionary{{"clientName", "b"}, {"serviceName", "s"}})};
  constexpr std::uint32_t kAggregating = 2;
  for (int round = 0; round < 5; ++round) {
    std::vector<std::shared_ptr<OrvantadSession>> sessions;
    std::vector<std::thread> threads;
    const std::size_t first = connections.size();
    for (std::uint32_t i = 0; i < 6; ++i) sessions.push_back(makeSession());
    for (std::uint32_t i = 0; i < sessions.size(); ++i) {
      threads.emplace_back([&, i] {
        OrvantadSession& session = *sessions[i];
        std::minstd_rand random(i + 1);
        configure(session, i, hierarchy("t", i), users[0], i < kAggregating);
        start(session);
        for (int turn = 0; turn < 30; ++turn) {
          if (i >= kAggregating && turn % 5 == 0) {
            configure(session, i, hierarchy(turn % 10 == 0 ? "t" : "u", 1 + random() % 3), users[0]);
          }
          session.fetchStatesWithUserInfo(users[random() % 2], {});
          send(session, {{"category", 3}, {"type", turn}, {"payload", Dictionary{{"i", i}}}});
          if (turn % 7 == 0) session.flushMessagesWithCompletion({});
        }
        leave(sessions[i]);
      });
    }
    for (auto& thread : threads) thread.join();
    for (std::size_t i = first; i < connections.size(); ++i) {
      const auto events = connections[i]->aggregated();
      const auto notices = std::count_if(events.begin(), events.end(), [](auto& e) { return e.isEndNotice(); });
      EXPECT_EQ(notices, i - first < kAggregating ? 1 : 0);
      EXPECT_TRUE(events.empty() || events.back().isEndNotice()) << "an event followed the end notice";
    }
  }
}

// The test's own threads meet in the leaf lock only: an event and the end of aggregation.
TEST_F(RelatedSessionsStressTest, NoEventFollowsTheEndOfAggregationAndItIsToldOnce) {
  platform::setLogLevel(platform::LogLevel::error);
  for (int round = 0; round < 200; ++round) {
    const auto session = makeSession();
    configure(*session, 1, {}, nullptr, true);
    Counter ready;
    std::vector<std::thread> threads;
    for (int i = 0; i < 3; ++i) {
      threads.emplace_back([&, i] {
        ready.add();
        ready.waitFor(3);
        for (int event = 0; event < 5; ++event) {
          if (i > 0) session->sendToAggregator(session->sessionInfo(), 1, 2, 3, nullptr);
        }
        if (i < 2) session->shutdownSessionAggregation();
      });
    }
    for (auto& thread : threads) thread.join();
    const auto events = connections.back()->aggregated();
    ASSERT_FALSE(events.empty());
    ASSERT_TRUE(events.back().isEndNotice()) << round;
    ASSERT_EQ(std::count_if(events.begin(), events.end(), [](auto& e) { return e.isEndNotice(); }), 1) << round;
    leave(session);
  }
}

TEST_F(RelatedSessionsStressTest, AFlushOnItsWayKeepsNoSessionAliveAndIsStillAnswered) {
  storebag = httpsStorebag();
  device.http.hold = true;
  auto session = OrvantadSession::create(device, agent, nullptr);
  const std::weak_ptr<OrvantadSession> watch = session;
  configure(*session, 1, {{"batchEvent", true}});
  start(*session);
  Kept<std::optional<std::string>, std::optional<OrvantaError>> kept;
  session->flushMessagesWithCompletion(kept.reply());
  leave(session);
  session.reset();
  EXPECT_TRUE(watch.expired());
  EXPECT_FALSE(kept.given());
  ASSERT_TRUE(eventually([&] { return device.http.finishHeld(ScriptedHttpClient::status(200)); }));
  EXPECT_TRUE(kept.given());
}

}  // namespace
}  // namespace orvanta::test
