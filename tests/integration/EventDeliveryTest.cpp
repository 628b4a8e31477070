#include <gtest/gtest.h>

#include "tests/integration/IntegrationFixture.h"

namespace orvanta::test {
namespace {

using EventDeliveryTest = IntegrationFixture;

TEST_F(EventDeliveryTest, AnEventStandsInTheInboxWithEveryReservedKeyAndItsType) {
  startDaemon();
  BackendNames names;
  auto session = openSession({.sessionID = 77, .clientType = 5, .clientVersion = 3}, {}, &names);
  EXPECT_EQ(names, (std::vector<std::string>{"http_post"}));
  send(*session, event(11, 12, {{"text", "hello"}, {"yes", true}, {"list", Array{1}}, {"day", platform::Date{86400}}}));
  ASSERT_TRUE(waitForClientEvents(1));
  const auto received = clientEvents()[0];
  const Dictionary& posted = received.event;
  const struct {
    const char* key;
    char type;  // i integer, n number, s string
  } reserved[] = {{"_startTS", 'i'},     {"_sender", 's'},        {"_clientVersion", 'i'}, {"_sessionID", 's'},
                  {"_eventNumber", 'i'}, {"_method", 'i'},        {"_status", 'i'},        {"_clientTS", 'n'},
                  {"eventTime", 'n'},    {"_productFamily", 's'}, {"_productModel", 's'},  {"_osVersion", 's'},
                  {"_build", 's'},       {"_internal", 'i'},      {"_reportVers", 's'},    {"_timezoneOffset", 'i'}};
  for (const auto& [key, type] : reserved) {
    const Value* value = posted.find(key);
    ASSERT_NE(value, nullptr) << key;
    EXPECT_TRUE(type == 's' ? value->string() != nullptr : type == 'i' ? value->isInteger() : value->isNumber()) << key;
  }
  EXPECT_EQ(posted.find("_sender")->description(), "ZK");
  EXPECT_EQ(number(received, "_method"), 11);
  EXPECT_EQ(number(received, "_status"), 12);
  EXPECT_EQ(number(received, "_eventNumber"), 2) << "the session-start record was the first";
  EXPECT_EQ(number(received, "_internal"), 2);
  EXPECT_EQ(posted.find("_reportVers")->description(), "8.0");
  EXPECT_EQ(posted.find("text")->description(), "hello");
  EXPECT_TRUE(posted.contains("yes")) << "booleans count as numbers and stay";
  EXPECT_EQ(posted.find("day")->doubleValue(), 86400);
  EXPECT_FALSE(posted.contains("list"));
  EXPECT_TRUE(
      daemon->logged("<4>HTTPSPostBackend(createMessageForPostAndLogging): Tressel unable to handle key: list, "
                     "value: "));
}

TEST_F(EventDeliveryTest, HeadersStandInTheirOrderAndGzipIsUsedOnlyWhenSmaller) {
  startDaemon();
  auto session =
      openSession({.sessionID = 1, .clientVersion = 3, .requireUserInfo = true}, UserInfo{"client", "service", {}});
  send(*session, event(3, 1, {{"long", std::string(2000, 'a')}}));
  ASSERT_TRUE(waitForClientEvents(1));
  const auto posts = server->requests(RequestKind::events);
  const auto& post = posts.back();
  std::vector<std::string> order;
  for (const auto& [name, value] : post.headers) {
    if (name != "Host") order.push_back(name);
  }
  EXPECT_EQ(order, (std::vector<std::string>{"X-ORV-Client-Name", "X-ORV-Service-Name", "User-Agent",
                                             "X-ORV-Client-Version", "X-ORV-Sender", "X-ORV-Event-Map", "Accept",
                                             "Content-Type", "Content-Length", "Content-Encoding"}));
  EXPECT_EQ(*post.header("User-Agent"), "Orvanta/8.0 (Parva3,2; 12.5)");
  EXPECT_EQ(*post.header("X-ORV-Event-Map"), "3 1");
  EXPECT_EQ(*post.header("Content-Length"), std::to_string(post.rawBody.size()));
  EXPECT_LT(post.rawBody.size(), post.body.size());
}

TEST_F(EventDeliveryTest, AServerErrorDisablesTheBackendAndOthersDoNot) {
  startDaemon();
  auto session = openSession({.sessionID = 1});
  server->setStatus("/events", 404);
  send(*session, event(1, 1));
  ASSERT_TRUE(waitForClientEvents(1));
  server->setStatus("/events", 503);
  send(*session, event(1, 2));
  ASSERT_TRUE(waitForClientEvents(2));
  ASSERT_TRUE(daemon->logged("<6>postJSONMessage: backend http_post disabled by server 503 return code"));
  server->clearBehaviours();
  send(*session, event(1, 3));
  flush(*session);
  EXPECT_EQ(clientEvents().size(), 2U) << "a disabled backend drops";
  // New user info evaluates the states again.
  ASSERT_TRUE(session->session().blocking().fetchStates(UserInfo{"c", "s", {}}.dictionary()));
  send(*session, event(1, 4));
  ASSERT_TRUE(waitForClientEvents(3));
}

TEST_F(EventDeliveryTest, TheOneOffPathSendsOneEvent) {
  startDaemon();
  auto connection = connect();
  auto answer = connection->session().blocking().sendMessage(SessionInfo{.sessionID = 5, .clientType = 5}.dictionary(),
                                                             nullptr, 8, 9, nullptr);
  ASSERT_TRUE(answer) << answer.error().text;
  EXPECT_EQ(*answer, "finished");
  ASSERT_TRUE(waitForClientEvents(1));
  EXPECT_EQ(number(clientEvents()[0], "_method"), 8);
  auto refused = connection->session().blocking().sendMessage(
      std::make_shared<const Dictionary>(Dictionary{{"clientType", 5}}), nullptr, 8, 9, nullptr);
  EXPECT_FALSE(refused) << "a reply that the daemon drops is an error, not silence";
}

TEST_F(EventDeliveryTest, WithTheServerDownConfluoFallsBackToBrisk) {
  options.storebagURL = "http://127.0.0.1:1/storebags";
  startDaemon();
  BackendNames names;
  auto session = openSession({.sessionID = 1, .clientType = 11}, {}, &names);
  EXPECT_EQ(names, (std::vector<std::string>{"brisk"}));
  EXPECT_TRUE(daemon->logged("<6>fetchStorebagWithName: Loading default storebag 'confluo'"));
  auto other = openSession({.sessionID = 2, .clientType = 5}, {}, &names);
  EXPECT_EQ(names, std::nullopt);
}

TEST_F(EventDeliveryTest, SessionsOfOneClientTypeShareAStorebagUntilItExpires) {
  startDaemon();
  auto first = openSession({.sessionID = 1});
  auto second = openSession({.sessionID = 2});
  EXPECT_EQ(server->requests(RequestKind::storebag).size(), 1U);
}

TEST_F(EventDeliveryTest, ATamperedStorebagIsRefused) {
  server->setFault("/storebags/*", collector::ConnectionFault::corrupt);
  startDaemon();
  BackendNames names;
  auto session = openSession({.sessionID = 1}, {}, &names);
  EXPECT_EQ(names, std::nullopt);
  EXPECT_TRUE(daemon->logged("<3>fetchAndCacheStorebag: Unable to fetch storebag for client type 5"));
}

// Whoever stands at the other end without a good certificate sees no byte of payload.
TEST_F(EventDeliveryTest, WithoutAGoodCertificateNoPayloadLeavesAndTheReasonIsLogged) {
  const std::pair<collector::CertificateFlaw, const char*> rows[] = {
      {collector::CertificateFlaw::wrongHost, "subject name"},
      {collector::CertificateFlaw::expired, "expired"},
      {collector::CertificateFlaw::selfSigned, "self"},
  };
  for (const auto& [flaw, reason] : rows) {
    collector::CollectorOptions flawed;
    flawed.certificateFlaw = flaw;
    startCollector(std::move(flawed));
    server->clear();
    startDaemon();
    auto session = openSession({.sessionID = 1});
    send(*session, event(1, 1, {{"secret", "do not leak"}}));
    ASSERT_TRUE(daemon->logged("<3>HTTPSPostBackend(postJsonMessage): post error: ", 2));
    EXPECT_TRUE(daemon->logged(reason)) << daemon->process().allLines();
    EXPECT_TRUE(server->requests(RequestKind::events).empty());
    session.reset();
    EXPECT_EQ(daemon->terminate(), 0);
  }
}

}  // namespace
}  // namespace orvanta::test
