#include <gtest/gtest.h>

#include "platform/codec/Json.h"
#include "tests/integration/IntegrationFixture.h"

namespace orvanta::test {
namespace {

using EventDeliveryTest = IntegrationFixture;

TEST_F(EventDeliveryTest, AnEventArrivesWithEveryReservedKeyUnderTheHeadersInTheirOrder) {
  startDaemon();
  BackendNames names;
  auto session = openSession({.sessionID = 77, .clientVersion = 3}, UserInfo{"client", "service", {}}, &names);
  EXPECT_EQ(names, (std::vector<std::string>{"http_post"}));
  const std::string text(2000, 'a');
  send(*session, event(11, 12, {{"text", text}, {"yes", true}, {"list", Array{1}}, {"day", platform::Date{86400}}}));
  ASSERT_TRUE(waitForClientEvents(1));
  Dictionary posted = clientEvents()[0].event;
  EXPECT_TRUE(posted.find("_sessionID") != nullptr && posted.find("_sessionID")->string() != nullptr);
  posted.erase("_sessionID");
  for (const char* time : {"_startTS", "_clientTS", "eventTime", "_timezoneOffset"}) {
    EXPECT_TRUE(posted.find(time) != nullptr && posted.find(time)->isNumber()) << time;
    posted.erase(time);
  }
  const std::string expected =
      R"({"_build":"12F5","_clientVersion":3,"_eventNumber":2,"_internal":2,"_method":11,"_osVersion":"12.5",)"
      R"("_productFamily":"Parva","_productModel":"Parva3,2","_reportVers":"8.0","_sender":"ZK","_status":12,)"
      R"("clientName":"client","day":86400,"serviceName":"service","text":")" +
      text + R"(","yes":true})";
  EXPECT_EQ(platform::writeJson(Value(posted)), expected);
  EXPECT_TRUE(
      daemon->logged("<4>HTTPSPostBackend(createMessageForPostAndLogging): Tressel unable to handle key: list"));

  const auto post = server->requests(RequestKind::events).back();
  std::string order;
  for (const auto& [name, value] : post.headers) {
    if (name != "Host") order += name + " ";
  }
  EXPECT_EQ(order,
            "X-ORV-Client-Name X-ORV-Service-Name User-Agent X-ORV-Client-Version X-ORV-Sender X-ORV-Event-Map "
            "Accept Content-Type Content-Length Content-Encoding ");
  EXPECT_EQ(*post.header("User-Agent"), "Orvanta/8.0 (Parva3,2; 12.5)");
  EXPECT_EQ(*post.header("X-ORV-Event-Map"), "11 12");
  EXPECT_LT(post.rawBody.size(), post.body.size());
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

TEST_F(EventDeliveryTest, ATamperedStorebagIsRefused) {
  server->setFault("/storebags/*", collector::ConnectionFault::corrupt);
  startDaemon();
  BackendNames names;
  auto session = openSession({.sessionID = 1}, {}, &names);
  EXPECT_EQ(names, std::nullopt);
  EXPECT_TRUE(daemon->logged("<3>fetchAndCacheStorebag: Unable to fetch storebag for client type 5"));
}

// A server without a valid certificate does not see a byte of payload.
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
