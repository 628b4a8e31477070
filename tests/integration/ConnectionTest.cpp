#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <thread>

#include "interface/RemoteCalls.h"
#include "tests/integration/IntegrationFixture.h"
#include "tests/support/Peer.h"

namespace orvanta::test {
namespace {

class ConnectionTest : public IntegrationFixture {
 protected:
  void SetUp() override {
    IntegrationFixture::SetUp();
    startDaemon();
  }
  RawClient rawClient() { return RawClient(daemon->runtimeDirectory()); }
};

TEST_F(ConnectionTest, AThousandPipelinedSendsAreAnsweredOnceEachInOrder) {
  auto session = openSession({.sessionID = 1});
  std::vector<int> order;
  std::promise<void> done;
  constexpr int kCalls = 1000;
  for (int i = 0; i < kCalls; ++i) {
    session->session().sendMessageWithDictionary(event(1, 1, {{"n", i}}).dictionary(),
                                                 StringReply([&, i](auto outcome) {
                                                   EXPECT_TRUE(outcome.values) << outcome.error.text;
                                                   order.push_back(i);
                                                   if (i == kCalls - 1) done.set_value();
                                                 }));
  }
  ASSERT_EQ(done.get_future().wait_for(kTimeout), std::future_status::ready);
  ASSERT_EQ(order.size(), static_cast<std::size_t>(kCalls));
  for (int i = 0; i < kCalls; ++i) EXPECT_EQ(order[i], i);
}

TEST_F(ConnectionTest, FiftyConnectionsAtOnceAreAllServed) {
  std::atomic<int> answered{0};
  std::vector<std::thread> clients;
  for (int c = 0; c < 50; ++c) {
    clients.emplace_back([this, c, &answered] {
      auto session = openSession({.sessionID = static_cast<std::uint32_t>(c), .batchEvent = true});
      for (int i = 0; i < 20; ++i) answered += session->session().blocking().sendMessage(event(1, 1)) ? 1 : 0;
    });
  }
  for (auto& client : clients) client.join();
  EXPECT_EQ(answered, 1000);
}

TEST_F(ConnectionTest, BrokenInputClosesItsConnectionWithOneLineAndNoOther) {
  auto bystander = openSession({.sessionID = 1, .batchEvent = true});
  const auto descriptorsBefore = daemon->descriptorCount();
  const struct {
    const char* what;
    Bytes bytes;
    bool halfClose;  // the client stops in the middle
  } rows[] = {
      {"garbage", {'G', 'E', 'T', ' ', '/'}, false},
      {"a frame of another shape", {0x93, 0x00, 0x01, 0x02}, false},
      {"a response", {0x94, 0x01, 0x01, 0xc0, 0x90}, false},
      {"nesting of 100,000", Bytes(100'000, 0x91), false},
      {"a byte that is never used", {0xc1}, false},
      {"a claim of 4 GiB", {0xc6, 0xff, 0xff, 0xff, 0xff}, false},
      {"an array of 4 GiB", {0x94, 0x00, 0x01, 0xa1, 'x', 0xdd, 0xff, 0xff, 0xff, 0xff}, false},
      {"truncated", {0x94, 0x00, 0x01, 0xaf, 'f'}, true},
  };
  const auto breakAll = [&] {
    for (const auto& row : rows) {
      SCOPED_TRACE(row.what);
      const auto closings = daemon->count("listener: Closing connection to");
      auto client = rawClient();
      client.write(request(1, "fetchDisplayURL"));
      client.write(row.bytes);
      auto first = client.answer();
      ASSERT_TRUE(first) << "whole calls before the broken one are carried out";
      EXPECT_EQ(first->messageID, 1U);
      if (row.halfClose) {
        client.shutdownSending();
      } else {
        client.readToEnd();
        EXPECT_TRUE(daemon->logged("listener: Closing connection to", closings + 1));
      }
      EXPECT_TRUE(bystander->session().blocking().sendMessage(event(1, 1)));
    }
  };
  breakAll();
  EXPECT_TRUE(daemon->settles([this] { return daemon->descriptorCount(); }, descriptorsBefore));
  EXPECT_EQ(daemon->count("<4>"), 7U) << "one line for each that broke the protocol";
  constexpr std::size_t kLeewayKiB = 512;
  EXPECT_TRUE(daemon->keepsItsMemory(kLeewayKiB, [&] {
    for (int round = 0; round < 10; ++round) breakAll();
  }));
}

TEST_F(ConnectionTest, RefusedCallsAreAnsweredAndTheConnectionGoesOn) {
  auto client = rawClient();
  Bytes twice = request(2, "sendMessageWithDictionary", {nullptr});
  twice.pop_back();
  append(twice, {0x82, 0xa1, 'a', 0x01, 0xa1, 'a', 0x02});  // {"a": 1, "a": 2} in place of null
  const struct {
    Bytes bytes;
    const char* error;
  } rows[] = {
      {request(2, "noSuchOperation"), "unknown method 'noSuchOperation'"},
      {request(2, "sendMessageWithCategory", {70000, 1, nullptr}), "integer from 0 to 65535"},
      {request(2, "sendMessageWithCategory", {1, 1}), "takes 3 arguments"},
      {request(2, "setSessionInfo", {1, nullptr, nullptr, false}), "must be a map"},
      {twice, "the key \"a\" twice"},
  };
  for (const auto& row : rows) {
    client.write(row.bytes);
    const auto answer = client.answer();
    ASSERT_TRUE(answer) << row.error;
    EXPECT_EQ(answer->messageID, 2U);
    ASSERT_NE(answer->error.string(), nullptr);
    EXPECT_NE(answer->error.string()->find(row.error), std::string::npos) << *answer->error.string();
  }
  for (const auto byte : request(3, "fetchDisplayURL")) client.write({byte});
  EXPECT_EQ(client.answer()->result, Value(Array{"URL not available"})) << "though its bytes came one at a time";
}

TEST_F(ConnectionTest, AfterAHalfCloseAnswersStillComeAndTheSessionStays) {
  auto client = rawClient();
  client.write(request(1, "fetchDisplayURL"));
  client.write(request(2, "fetchDisplayURL"));
  client.shutdownSending();
  EXPECT_EQ(client.answer()->messageID, 1U);
  EXPECT_EQ(client.answer()->messageID, 2U);
  EXPECT_TRUE(daemon->logged("was interrupted"));
  EXPECT_EQ(daemon->count("was invalidated"), 0U);
}

TEST_F(ConnectionTest, SIGTERMEndsAFetchAndLeavesNoRequestThatWasReadWithoutAnAnswer) {
  constexpr std::uint32_t kCalls =
      2 * platform::Connection::kFramesPerTurn;  // more than a connection carries out in one turn
  server->setFault("/storebags/*", collector::ConnectionFault::silent);
  auto client = rawClient();
  Bytes calls =
      request(0, "setSessionInfo", {Dictionary{{"sessionID", 1}, {"clientType", 5}}, nullptr, nullptr, false});
  append(calls, request(1, "startConfigWithCompletionHandler"));
  for (std::uint32_t id = 2; id < kCalls; ++id) append(calls, request(id, "fetchDisplayURL"));
  ASSERT_TRUE(client.write(calls));
  ASSERT_TRUE(daemon->logged("fetchAndCacheStorebag: Fetching storebag"));
  EXPECT_EQ(daemon->terminate(), 0);
  EXPECT_EQ(daemon->count("sendSynchronousRequest error Aborted: the process is ending"), 1U) << "not after 15 s";
  // Usually the end comes before the second turn, whose calls are then refused.
  for (std::uint32_t id = 0; id < kCalls; ++id) {
    const auto answer = client.answer();
    ASSERT_TRUE(answer) << id;
    EXPECT_EQ(answer->messageID, id);
    if (const std::string* error = answer->error.string()) {
      EXPECT_EQ(*error, "fetchDisplayURL: the daemon is ending");
    }
  }
  EXPECT_FALSE(client.answer());
}

TEST_F(ConnectionTest, AClientThatNeverReadsStopsBeingReadAndHarmsNoOther) {
  auto bystander = openSession({.sessionID = 1, .batchEvent = true});
  const auto residentBefore = daemon->residentKiB();
  auto silent = rawClient();
  Bytes burst;
  for (int i = 0; i < 1000; ++i) append(burst, request(5, "fetchDisplayURL"));
  std::atomic<bool> stopped{false};
  std::thread writer([&] {
    // Goes on until the daemon takes no more; the end of the connection wakes it.
    while (!stopped && silent.write(burst)) {
    }
  });
  for (int i = 0; i < 200; ++i) EXPECT_TRUE(bystander->session().blocking().sendMessage(event(1, 1)));
  EXPECT_LT(daemon->residentKiB(), residentBefore + 32 * 1024);
  stopped = true;
  EXPECT_EQ(daemon->terminate(), 0);
  writer.join();
}

TEST_F(ConnectionTest, AnAggregatorThatDoesNotReadDelaysNoOtherAndHearsOfItsEnd) {
  auto aggregator = rawClient();
  SessionInfo info{.sessionID = 1, .clientType = 5, .batchEvent = true};
  info.hierarchyToken = HierarchyToken{"t", 0};
  ASSERT_TRUE(aggregator.write(request(1, "setSessionInfo", {*info.dictionary(), nullptr, nullptr, true})));
  ASSERT_TRUE(aggregator.answer());
  info.hierarchyToken = HierarchyToken{"t", 1};
  auto sender = openSession(info, UserInfo{"client", "service", {}});
  // More than its socket and the daemon hold for it.
  const std::string large(20'000, 'x');
  for (std::uint16_t i = 0; i < 400; ++i) send(*sender, event(1, i, {{"text", large}}));
  EXPECT_TRUE(daemon->logged("<4>sendMessageToClient: Dropping aggregated events: ", 1));
  EXPECT_EQ(daemon->count("Dropping aggregated events"), 1U);

  // Once it reads, it hears the oldest in order, loses those in between, and hears of the end last.
  daemon->process().signal(SIGTERM);
  std::vector<AggregatedEvent> heard;
  while (auto frame = aggregator.answer()) {
    auto received = decodeSendMessageToClient(*frame);
    if (received && (received->category == 1 || received->isEndNotice())) heard.push_back(std::move(*received));
  }
  ASSERT_GT(heard.size(), 200U);
  for (std::size_t i = 0; i < 200; ++i) ASSERT_EQ(heard[i].type, i);
  EXPECT_TRUE(heard.back().isEndNotice());
  EXPECT_EQ(daemon->process().wait(), 0);
}

TEST_F(ConnectionTest, AClientThatDiesInTheMiddleOfACallTakesItsSessionAlong) {
  rawClient().write({0x94, 0x00, 0x01});
  EXPECT_TRUE(daemon->logged("was invalidated"));
}

using StartedLaterTest = IntegrationFixture;

TEST_F(StartedLaterTest, OneSessionsFetchHoldsUpNoOtherSessionsEventsAndEndsAtItsLimit) {
  startDaemon();
  auto working = openSession({.sessionID = 1, .clientType = 5, .batchEvent = true});
  server->setFault("/storebags/brindle", collector::ConnectionFault::silent);
  std::vector<std::unique_ptr<OrvantaConnection>> blocked;
  std::promise<BackendNames> answered;
  for (int i = 0; i < 8; ++i) {  // more than the pool has threads
    blocked.push_back(connect());
    blocked.back()->session().setSessionInfo(SessionInfo{.sessionID = 2, .clientType = 6}.dictionary(), nullptr,
                                             nullptr, false, {});
    blocked.back()->session().startConfigWithCompletionHandler(
        i > 0 ? BackendNamesReply{} : BackendNamesReply([&answered](auto outcome) {
          answered.set_value(outcome.values ? std::get<0>(*outcome.values) : BackendNames{});
        }));
  }
  ASSERT_TRUE(daemon->logged("fetchAndCacheStorebag: Fetching storebag for client type 6"));
  auto outcome = answered.get_future();
  int sent = 0;
  while (outcome.wait_for(std::chrono::milliseconds(0)) != std::future_status::ready) {
    ASSERT_TRUE(working->session().blocking().sendMessage(event(1, 1)));
    ++sent;
    ASSERT_LT(sent, 50'000'000);
  }
  EXPECT_GT(sent, 100) << "events went on during the 15 seconds of the fetch";
  EXPECT_EQ(outcome.get(), std::nullopt);
  EXPECT_EQ(server->requests(RequestKind::storebag).size(), 2U) << "after a failure no session asks again at once";
}

}  // namespace
}  // namespace orvanta::test
