#include <gtest/gtest.h>

#include <map>

#include "backends/OrvantaBackend.h"
#include "platform/codec/Json.h"
#include "tests/integration/IntegrationFixture.h"

namespace orvanta::test {
namespace {

// The HTTPS backend's delivery as a client and a server see it.
class BatchingTest : public IntegrationFixture {
 protected:
  static SessionInfo batching(bool requiresUserInfo = true) {
    return {.sessionID = 1, .clientType = 5, .requireUserInfo = requiresUserInfo, .batchEvent = true};
  }
  static UserInfo user() { return {"client", "service", {}}; }
  std::vector<collector::ReceivedRequest> posts() { return server->requests(RequestKind::events); }
  bool waitForPosts(std::size_t count) { return server->waitForRequests(RequestKind::events, count, kTimeout); }
};

TEST_F(BatchingTest, ARealtimeEventIsPrecededByWhatWaited) {
  startDaemon();
  auto session = openSession(batching(), user());
  flush(*session);  // the session-start record
  ASSERT_TRUE(waitForPosts(1));
  for (const std::uint16_t type : {1, 2, 3}) EXPECT_EQ(send(*session, event(5, type)), std::nullopt);
  auto realtime = event(5, 4);
  realtime.realtime = true;
  const auto reply = send(*session, realtime);
  EXPECT_EQ(daemon->count("<7>HTTPSPostBackend(sendMessage): Got a realtime event and some events have already been "
                          "batched. Forcing Flush here to keep events in order."),
            1U);
  ASSERT_TRUE(waitForPosts(3));
  const auto received = posts();
  EXPECT_EQ(received[1].path, "/events");
  EXPECT_EQ(received[2].path, "/events/realtime");
  const auto events = clientEvents();
  ASSERT_EQ(events.size(), 4U);
  for (std::size_t i = 0; i < 4; ++i) EXPECT_EQ(number(events[i], "_status"), std::int64_t(i) + 1);
  EXPECT_EQ(events[2].request, received[1].id);
  EXPECT_EQ(received[1].header("X-ORV-Event-Map"), nullptr);
  // With consent the client sees what was sent.
  const std::string head = "Flushed events:\n", middle = "\nStandalone event:\n";
  ASSERT_TRUE(reply && reply->starts_with(head));
  const std::size_t cut = reply->find(middle);
  ASSERT_NE(cut, std::string::npos);
  EXPECT_EQ(*platform::parseJson(reply->substr(head.size(), cut - head.size())),
            *platform::parseJson(received[1].body));
  EXPECT_EQ(*platform::parseJson(reply->substr(cut + middle.size())), *platform::parseJson(received[2].body));
}

TEST_F(BatchingTest, WithoutConsentNothingLeavesUnlessOverridden) {
  options.device.set("DiagnosticsSubmissionAllowed", false);
  startDaemon();
  BackendNames names;
  auto session = openSession(batching(), user(), &names);
  EXPECT_EQ(names, std::vector<std::string>{});
  send(*session, event(5, 1));
  EXPECT_EQ(flush(*session).error, makeOrvantaError("Nothing to flush", -1));
  EXPECT_TRUE(daemon->logged("<7>HTTPSPostBackend(updateBackendState): reporting disabled by DNU: 0."));
  session.reset();
  EXPECT_EQ(daemon->terminate(), 0);
  EXPECT_TRUE(posts().empty());

  setSection({{"http_post", httpPost(clientSection({{"override_dnu", 1}}))}});
  startDaemon();
  session = openSession(batching(), user());
  send(*session, event(5, 1));
  const auto answer = flush(*session);
  EXPECT_EQ(answer.text, std::nullopt) << "nothing of the text comes back";
  EXPECT_EQ(answer.error, std::nullopt);
  ASSERT_TRUE(waitForClientEvents(1));
}

TEST_F(BatchingTest, AHeldSessionIsPromotedAndAFlushSendsWhatItHeld) {
  setSection({{"http_post", httpPost(clientSection({{"sampling_threshold", 0.0}}))}});
  startDaemon();
  auto session = openSession({.sessionID = 1, .requireUserInfo = true}, user());
  send(*session, event(5, 1));
  auto promoting = event(5, 2);
  promoting.promote = true;
  send(*session, promoting);  // at once, and what was held stays where it is
  EXPECT_EQ(flush(*session).error, std::nullopt);
  ASSERT_TRUE(waitForClientEvents(2));
  EXPECT_EQ(number(clientEvents()[0], "_status"), 2);
}

TEST_F(BatchingTest, FlushesThatCannotSendSayWhy) {
  setSection({{"http_post", httpPost(clientSection({{"event_blacklist", Array{6}}}))}});
  startDaemon();
  auto session = openSession(batching(), user());
  EXPECT_EQ(flush(*session).error, std::nullopt);
  EXPECT_EQ(flush(*session).error, makeOrvantaError("Nothing to flush", -1));
  // Batched before the lists were known, since there was no user info to evaluate them for.
  auto anonymous = openSession(batching());
  send(*anonymous, event(6, 1));
  EXPECT_EQ(flush(*anonymous).error, makeOrvantaError("Nothing to flush", -1)) << "waiting: the batch is dropped";
  send(*anonymous, event(6, 2));
  ASSERT_TRUE(anonymous->session().blocking().fetchStates(user().dictionary()));
  EXPECT_EQ(flush(*anonymous).error,
            makeOrvantaError("Nothing to flush: batched events were completely filtered out", -1));
  EXPECT_EQ(flush(*anonymous).error, makeOrvantaError("Nothing to flush", -1)) << "the batch is gone";
  // Its parent reports and lets it report, too, but it has no user info of its own.
  SessionInfo related = batching();
  related.hierarchyToken = HierarchyToken{"call", 1};
  auto child = openSession(related);
  related.hierarchyToken = HierarchyToken{"call", 0};
  auto parent = openSession(related, user());
  send(*child, event(5, 1));
  EXPECT_EQ(flush(*child).error, makeOrvantaError("Can not flush: userInfo is required", -1));
}

TEST_F(BatchingTest, AServerErrorAnswersTheFlushAndDisables) {
  startDaemon();
  server->setStatus("/events", 503);
  auto session = openSession(batching(), user());
  send(*session, event(5, 1));
  const auto answer = flush(*session);
  EXPECT_EQ(answer.error, makeOrvantaError("backend http_post disabled by server 503 return code", 503));
  server->clearBehaviours();
  send(*session, event(5, 2));
  EXPECT_EQ(flush(*session).error, makeOrvantaError("Nothing to flush", -1));
  // The flush returned text and so froze the state: no evaluation enables it again.
  ASSERT_TRUE(session->session().blocking().fetchStates(UserInfo{"other", "service", {}}.dictionary()));
  send(*session, event(5, 3));
  EXPECT_EQ(flush(*session).error, makeOrvantaError("Nothing to flush", -1));
}

TEST_F(BatchingTest, AFilteredFieldIsInNoBodyOnAnyPath) {
  const std::string secret = "correct-horse-battery";
  const std::string hashedOnly = "staple-7731";
  setSection({{"http_post",
               httpPost(clientSection({{"event_threshold", 3},
                                       {"filters", Array{Dictionary{{"key", "PassPhrase"}, {"action", "remove"}},
                                                         Dictionary{{"key", "clientName"}, {"action", "remove"}},
                                                         Dictionary{{"key", "account"}, {"action", "sha256"}}}}}))}});
  startDaemon();
  UserInfo info = user();
  const std::string client = "Name of the client";
  info.clientName = client;
  info.others = {{"passphrase", secret}, {"Account", hashedOnly}};
  const Dictionary payload{{"passPhrase", secret}, {"account", hashedOnly}, {"fine", "visible"}};
  auto batchingSession = openSession(batching(), info);
  for (int i = 0; i < 12; ++i) send(*batchingSession, event(5, 1, payload));  // threshold flushes
  auto realtime = event(5, 2, payload);
  realtime.realtime = true;
  send(*batchingSession, realtime);  // forced flush and direct
  send(*batchingSession, event(5, 3, payload));
  flush(*batchingSession);
  auto direct = openSession({.sessionID = 2, .requireUserInfo = true}, info);
  send(*direct, event(7, 1, payload));
  ASSERT_TRUE(waitForClientEvents(15));
  batchingSession.reset();
  direct.reset();
  EXPECT_EQ(daemon->terminate(), 0);
  EXPECT_EQ(server->requests(RequestKind::storebag).size(), 1U) << "sessions of one client type share it";
  const std::string digest = OrvantaBackend::convertIntoSHA256(hashedOnly);
  std::size_t visible = 0, hashed = 0, named = 0;
  for (const auto& request : server->requests()) {
    for (const std::string* body : {&request.rawBody, &request.body, &request.target}) {
      EXPECT_EQ(body->find(secret), std::string::npos);
      EXPECT_EQ(body->find(hashedOnly), std::string::npos);
      EXPECT_EQ(body->find(client), std::string::npos);
      EXPECT_EQ(body->find(OrvantaBackend::convertIntoSHA256(digest)), std::string::npos)
          << "a filter never hashes twice";
    }
    for (const auto& [name, value] : request.headers) EXPECT_EQ(value.find(secret), std::string::npos) << name;
    const std::string* name = request.header("X-ORV-Client-Name");
    if (name != nullptr && *name == client) ++named;
    if (request.body.find("visible") != std::string::npos) ++visible;
    if (request.body.find(digest) != std::string::npos) ++hashed;
  }
  EXPECT_GE(visible, 4U);
  EXPECT_GE(hashed, visible);
  EXPECT_GE(named, visible) << "filters do not reach the headers";
}

TEST_F(BatchingTest, TenThousandEventsArriveOnceAndInOrderAndLeaveNoMemoryBehind) {
  setSection({{"http_post", httpPost(clientSection({{"post_url", server->eventsURL(false)}}))}});
  startQuietDaemon();
  auto session = openSession(batching(false));
  constexpr int kEvents = 10'000;
  const auto sendAll = [&] {
    server->clear();
    std::atomic<int> replies{0};
    for (int i = 0; i < kEvents; ++i) {
      session->session().sendMessageWithDictionary(
          event(static_cast<std::uint16_t>(100 + i % 40), 1, {{"n", i}}).dictionary(),
          StringReply([&replies](auto outcome) { replies += outcome.values ? 1 : 0; }));
    }
    flush(*session);
    EXPECT_EQ(replies, kEvents);
    ASSERT_TRUE(waitForClientEvents(kEvents));
    const auto events = clientEvents();
    ASSERT_EQ(events.size(), static_cast<std::size_t>(kEvents));
    std::map<std::int64_t, std::int64_t> next;  // category -> the event that comes next
    for (int category = 0; category < 40; ++category) next[100 + category] = category;
    for (const auto& received : events) {
      const auto category = number(received, "_method");
      ASSERT_EQ(number(received, "n"), next[category]) << "category " << category;
      next[category] += 40;
    }
  };
  sendAll();
  EXPECT_TRUE(daemon->keepsItsMemory(daemon->residentKiB() / 50, [&] {
    for (int round = 0; round < 3; ++round) sendAll();
  }));
}

}  // namespace
}  // namespace orvanta::test
