#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <future>
#include <thread>
#include <utility>

#include "interface/OrvantaConstants.h"
#include "platform/codec/PropertyList.h"
#include "tests/platform/Waiting.h"
#include "tests/support/SessionFixture.h"

namespace orvanta::test {
namespace {

// Keeps its delegate, and plays the peer that comes and goes.
struct Peer final : public RecordingConnection {
  using RecordingConnection::RecordingConnection;
  ~Peer() override {
    if (whenDestroyed) whenDestroyed();
  }
  void resume(std::shared_ptr<platform::ConnectionDelegate> given) override { delegate = std::move(given); }
  void cancel(std::chrono::milliseconds) override { delegate.reset(); }
  void call(const char* method, Array params) const {
    platform::Frame frame;
    frame.kind = platform::Frame::Kind::request;
    frame.method = method;
    frame.params = std::move(params);
    onQueue([&] { delegate->received(std::move(frame)); });
  }
  void leave() {
    onQueue([this] { std::exchange(delegate, nullptr)->invalidated(std::nullopt); });
  }
  std::shared_ptr<platform::ConnectionDelegate> delegate;
  std::function<void()> whenDestroyed;

 private:
  // Returns when the step has run there, as a connection's calls do.
  void onQueue(const std::function<void()>& step) const {
    if (queue()->isCurrent()) return step();
    Counter done;
    queue()->post([&] {
      step();
      done.add();
    });
    ASSERT_TRUE(done.waitFor(1));
  }
};

class ConcurrentSessionsTest : public SessionFixture {
 protected:
  ConcurrentSessionsTest() {
    device.directory.write("etc/entitlements.d/all.plist",
                           *platform::writeXmlPropertyList(
                               Dictionary{{"user", std::to_string(::getuid())},
                                          {"entitlements", Dictionary{{std::string(kOrvantaEntitlement), true}}}}));
    const Dictionary client{{"post_url", "http://127.0.0.1/post"}, {"event_threshold", 5}};
    storebag = shared({{"http_post", Dictionary{{"clients", Array{client}}}}, {"voltmark", Dictionary{}}});
    platform::setLogLevel(platform::LogLevel::error);
  }
  bool admits(const std::shared_ptr<Peer>& peer) {
    platform::PeerIdentity identity;
    identity.uid = ::getuid();
    return agent.listenerShouldAcceptNewConnection({peer, identity});
  }
};

// The agent's storebag server keeps silent until the test has had enough.
class SilentServerTest : public ConcurrentSessionsTest {
 public:
  ~SilentServerTest() override {
    release();
    _waiting.wait();
    device.get().pool().drain(kHangGuard);
  }

 protected:
  // A session that holds the agent's lock from now on, waiting for its storebag.
  void beginFetch() {
    whileFetching = [this] {
      _asked.add();
      _release.waitFor(1);
    };
    const auto fetching = makeSession();
    configure(*fetching, 1);
    _waiting = std::async(std::launch::async, [this, fetching] { start(*fetching); });
    ASSERT_TRUE(_asked.waitFor(1));
  }
  // Returns whether the step ends while the fetch does not.
  template <class Step>
  bool passes(Step step) {
    auto done = std::async(std::launch::async, step);
    const bool passed = done.wait_for(kHangGuard) == std::future_status::ready;
    if (!passed) release();
    return passed;
  }
  void release() { _release.add(); }

 private:
  Counter _asked, _release;
  std::future<void> _waiting;
};

TEST_F(SilentServerTest, OnlySessionsBelowAnotherWaitForIt) {
  maxAge = 0;
  const auto related = makeSession();
  configure(*related, 4, hierarchy("t", 0));
  // An aggregating root, a session below it without user info, and one outside all groups.
  std::vector<std::shared_ptr<OrvantadSession>> free;
  for (std::uint32_t i = 0; i < 3; ++i) {
    free.push_back(makeSession());
    configure(*free[i], 5 + i, i < 2 ? hierarchy("u", i) : Dictionary(),
              i == 0 ? shared({{"clientName", "c"}, {"serviceName", "s"}}) : nullptr, i == 0);
    start(*free[i]);
  }
  const auto rootClient = connections[connections.size() - 3];
  beginFetch();
  // One that leaves a group waits for the agent, but with no other lock in its hands.
  const auto leaving = std::async(std::launch::async, [&] { leave(related); });
  EXPECT_TRUE(passes([&] {
    for (const auto& session : free) send(*session, {{"category", 5}, {"type", 9}});
  }));
  EXPECT_EQ(rootClient->aggregated().back().type, 9);
  EXPECT_TRUE(passes([this] {
    const auto peer = std::make_shared<Peer>(device.get().pool());
    EXPECT_TRUE(admits(peer));
    peer->call("setSessionInfo", {Dictionary{{"sessionID", 2}, {"clientType", 7}}, nullptr, nullptr, true});
    peer->call("sendMessageWithDictionary", {Dictionary{{"category", 1}, {"type", 2}}});
    peer->leave();
  }));
  EXPECT_TRUE(passes([this] { EXPECT_EQ(agent.sessions().openCount(), 0U); }));
  release();
}

TEST_F(SilentServerTest, SessionsThatWaitForTheAgentLeaveTheThreadsOfThePoolToOthers) {
  beginFetch();
  Counter waiting;
  for (std::uint32_t i = 0; i < 8; ++i) {
    device.get().pool().post([&, session = makeSession()] {
      waiting.add();
      configure(*session, 3, hierarchy("t", 0));
      leave(session);
    });
  }
  EXPECT_TRUE(passes([&] {
    EXPECT_TRUE(waiting.waitFor(8)) << "they hold every thread";
    Counter ran;
    device.get().pool().post([&] { ran.add(); });
    EXPECT_TRUE(ran.waitFor(1));
  }));
}

TEST_F(ConcurrentSessionsTest, TheProcessIsBusyFromTheFirstAdmissionToTheLastDeparture) {
  const auto& mark = device.get().keepAlive();
  auto& sessions = agent.sessions();
  const auto expect = [&](std::size_t open, std::uint64_t begun, std::uint64_t ended) {
    EXPECT_EQ(sessions.openCount(), open);
    EXPECT_EQ(mark.begun(), begun);
    EXPECT_EQ(mark.ended(), ended);
  };
  std::vector<std::shared_ptr<Peer>> peers;
  for (int i = 0; i < 3; ++i) peers.push_back(std::make_shared<Peer>(device.get().pool()));
  ASSERT_TRUE(admits(peers[0]));
  ASSERT_TRUE(admits(peers[1]));
  expect(2, 1, 0);
  peers[0]->leave();
  expect(1, 1, 0);
  peers[1]->leave();
  expect(0, 1, 1);
  ASSERT_TRUE(admits(peers[2]));
  expect(1, 2, 1);
  peers[2]->leave();
  expect(0, 2, 2);
  // There is nothing left to wait for.
  EXPECT_TRUE(sessions.endAll());
  sessions.waitForClients();
}

// Some clients leave while the daemon ends the sessions of all.
TEST_F(ConcurrentSessionsTest, AllHaveEndedAndWhatGoesWithThemMayAskTheAgent) {
  platform::setLogLevel(platform::LogLevel::debug);
  constexpr int kSessions = 50;
  Counter destroyed;
  for (int i = 0; i < kSessions; ++i) {
    const auto peer = std::make_shared<Peer>(device.get().pool());
    peer->whenDestroyed = [&] {
      agent.sessions().openCount();  // takes the session list's lock
      destroyed.add();
    };
    ASSERT_TRUE(admits(peer));
    if (i % 2 == 0) peer->queue()->post([peer] { peer->leave(); });
  }
  agent.sessions().endAll();
  EXPECT_EQ(log.count("<7>dealloc: OrvantadSession dealloc: "), std::size_t{kSessions});
  EXPECT_TRUE(destroyed.waitFor(kSessions));
  EXPECT_FALSE(admits(std::make_shared<Peer>(device.get().pool())));
  EXPECT_FALSE(log.contains("was dropped before it ended"));
}

// The test's own threads meet in the leaf lock only: an event and the end of aggregation.
TEST_F(ConcurrentSessionsTest, NoEventFollowsTheEndOfAggregationAndItIsToldOnce) {
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
          if (i > 0) session->sendToAggregator(session->sessionInfo(), {.category = 2, .type = 3});
        }
        if (i < 2) session->shutdownSessionAggregation();
      });
    }
    for (auto& thread : threads) thread.join();
    const auto events = connections.back()->aggregated();
    ASSERT_EQ(std::count_if(events.begin(), events.end(), [](auto& event) { return event.isEndNotice(); }), 1) << round;
    ASSERT_TRUE(events.back().isEndNotice()) << round;
    leave(session);
  }
}

TEST_F(ConcurrentSessionsTest, AFlushOnItsWayKeepsNothingAliveAndIsStillAnswered) {
  device.http.hold = true;
  device.device.consent = true;
  for (const int status : {200, 503}) {
    auto session = OrvantadSession::create(device, agent, nullptr);
    configure(*session, 1, {{"batchEvent", true}});
    start(*session);
    const std::weak_ptr<OrvantadSession> watch = session;
    const std::weak_ptr<OrvantaBackend> backend = session->backends()->begin()->backend;
    KeptFlush kept;
    session->flushMessagesWithCompletion(kept.reply());
    leave(session);
    session.reset();
    EXPECT_TRUE(watch.expired() && backend.expired());
    EXPECT_FALSE(kept.given());
    EXPECT_TRUE(eventually([&] {
      device.http.finishHeld(ScriptedHttpClient::status(status));
      return kept.given();
    }));
    EXPECT_TRUE(kept.get<0>()) << "what was sent";
    EXPECT_EQ(kept.get<1>().has_value(), status == 503);
  }
}

}  // namespace
}  // namespace orvanta::test
