#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "tests/support/SessionFixture.h"

namespace orvanta::test {
namespace {

// Events through a session whose power-log backend shows what reached the backends.
class SessionIntakeTest : public SessionFixture {
 protected:
  SessionIntakeTest() { storebag = shared(Dictionary{{"voltmark", Dictionary{}}}); }

  std::shared_ptr<OrvantadSession> started() {
    auto session = makeSession();
    configure(*session, 11, {}, nullptr, true);
    start(*session);
    device.powerLog.records.clear();
    connections.back()->received->frames.clear();
    return session;
  }
  std::string messageLog() {
    std::string content;
    const std::filesystem::path directory = device.get().files().stateDirectory + "/Logs/Faultline/Retired";
    if (!std::filesystem::exists(directory)) return content;
    for (const auto& file : std::filesystem::directory_iterator(directory)) {
      std::ifstream in(file.path());
      content.append(std::istreambuf_iterator<char>(in), {});
    }
    return content;
  }
};

TEST_F(SessionIntakeTest, MandatoryParametersAreNumbers) {
  const auto session = started();
  const struct {
    Dictionary parameters;
    const char* missing;
  } rows[] = {
      {{}, "category"},
      {{{"type", 1}}, "category"},
      {{{"category", 1}}, "type"},
      {{{"category", "1"}, {"type", 1}}, "category"},
      {{{"category", 1}, {"type", Array{}}}, "type"},
  };
  for (const auto& row : rows) {
    log.clear();
    EXPECT_EQ(send(*session, row.parameters), std::nullopt);
    EXPECT_EQ(log.count("Missing mandatory parameter"), 1U);
    EXPECT_TRUE(
        log.contains(std::string("<7>sendMessageWithDictionary: Missing mandatory parameter '") + row.missing + "'"));
  }
  EXPECT_TRUE(device.powerLog.records.empty());
  EXPECT_TRUE(connections.back()->aggregated().empty());
}

TEST_F(SessionIntakeTest, NumbersAreCutToSixteenBits) {
  const auto session = started();
  const struct {
    Value category;
    int expected;
  } rows[] = {{65537, 1}, {65536 + 77, 77}, {-1, 65535}, {3.9, 3}, {4294967297LL, 1}};
  for (const auto& row : rows) {
    device.powerLog.records.clear();
    send(*session, {{"category", row.category}, {"type", 65538}, {"payload", Dictionary{{"x", 1}}}});
    ASSERT_EQ(device.powerLog.records.size(), 1U) << row.category.description();
    EXPECT_EQ(device.powerLog.records[0].record.find("method")->integerValue(), row.expected);
    EXPECT_EQ(device.powerLog.records[0].record.find("respCode")->integerValue(), 2);
  }
  // 65536 is category 0, which the power log never sees; the aggregating client does.
  send(*session, {{"category", 65536}, {"type", 9}});
  EXPECT_EQ(connections.back()->aggregated().back().category, 0);
  EXPECT_EQ(connections.back()->aggregated().back().type, 9);
}

TEST_F(SessionIntakeTest, AggregationGetsEveryValidEventWithItsTime) {
  const auto session = started();
  device.clock.set(1'700'000'123.25);
  send(*session, {{"category", 3}, {"type", 4}, {"payload", Dictionary{{"a", 1}}}});
  const auto events = connections.back()->aggregated();
  ASSERT_EQ(events.size(), 1U);
  EXPECT_EQ(events[0].timestamp, 1'700'000'123.25);
  EXPECT_EQ(*events[0].payload, (Dictionary{{"a", 1}}));
}

TEST_F(SessionIntakeTest, AnAggregatingClientThatDoesNotReadLosesEventsAndNothingElse) {
  const auto session = started();
  auto& client = *connections.back()->received;
  client.full = true;
  for (int i = 0; i < 100; ++i) send(*session, {{"category", 3}, {"type", i}});
  EXPECT_EQ(log.count("<4>sendMessageToClient: Dropping aggregated events"), 1U);
  client.full = false;
  send(*session, {{"category", 3}, {"type", 200}});
  EXPECT_EQ(log.count("<5>sendMessageToClient: The client reads again; 100 aggregated events were dropped"), 1U);
  client.full = true;
  session->shutdownSessionAggregation();
  EXPECT_TRUE(connections.back()->aggregated().back().isEndNotice()) << "notices are never dropped";
}

TEST_F(SessionIntakeTest, AnAggregatingClientThatHasGoneIsNotTakenForASlowOne) {
  const auto session = started();
  connections.back()->received->closed = true;
  send(*session, {{"category", 3}, {"type", 4}});
  EXPECT_EQ(log.count("<3>sendMessageWithDictionary: Failed to get remote object proxy: the connection is closed"), 1U);
  EXPECT_EQ(log.count("Dropping aggregated events"), 0U);
}

TEST_F(SessionIntakeTest, TheLastHTTPSTextOrElseNothingBecomesTheReply) {
  device.device.consent = true;
  const Dictionary clients{{"clients", Array{Dictionary{{"post_url", "http://127.0.0.1/x"}}}}};
  storebag = shared(Dictionary{{"http_post", clients}, {"voltmark", Dictionary{}}});
  const auto session = started();
  const auto reply = send(*session, {{"category", 3}, {"type", 4}, {"payload", Dictionary{{"greeting", "hello"}}}});
  ASSERT_TRUE(reply);
  EXPECT_NE(reply->find("hello"), std::string::npos);
  EXPECT_NE(messageLog().find("[http_post -> sendMessageWithDictionary] " + *reply), std::string::npos);
  EXPECT_EQ(messageLog().find("[voltmark"), std::string::npos);
}

TEST_F(SessionIntakeTest, AOneOffEventNeedsIdentifiers) {
  const auto session = makeSession();
  for (const auto& info : {Dictionary{{"sessionID", 1}}, Dictionary{{"clientType", 5}}, Dictionary{}}) {
    Kept<std::optional<std::string>> kept;
    session->sendMessageWithSessionInfo(shared(info), nullptr, 1, 1, nullptr, kept.reply());
    EXPECT_FALSE(kept.given());
    EXPECT_EQ(kept.error(), "the reply was dropped without being given");
  }
  EXPECT_EQ(log.count("<3>sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo"), 3U);
}

TEST_F(SessionIntakeTest, AOneOffEventGoesThroughBackendsOfItsOwn) {
  const auto session = makeSession();
  Kept<std::optional<std::string>> kept;
  session->sendMessageWithSessionInfo(shared({{"sessionID", 9}, {"clientType", 5}}), shared({{"clientName", "c"}}), 6,
                                      7, shared({{"x", 1}}), kept.reply());
  ASSERT_TRUE(kept.given());
  EXPECT_EQ(kept.get(), "finished");
  ASSERT_EQ(device.powerLog.records.size(), 1U);
  EXPECT_EQ(device.powerLog.records[0].record.find("event")->integerValue(), 1);
  EXPECT_EQ(session->backends(), nullptr);
  EXPECT_EQ(session->sessionID(), 9U);
  EXPECT_TRUE(log.contains("<4>sendMessageWithSessionInfo: user info provided without requiring it."));

  storebag = nullptr;
  Kept<std::optional<std::string>> none;
  session->sendMessageWithSessionInfo(shared({{"sessionID", 9}, {"clientType", 6}}), nullptr, 6, 7, nullptr,
                                      none.reply());
  EXPECT_EQ(none.get(), "storebag not available");
}

TEST_F(SessionIntakeTest, AFlushWithoutBackendsSaysSo) {
  for (const bool empty : {false, true}) {
    storebag = empty ? shared(Dictionary{}) : nullptr;
    const auto session = makeSession();
    configure(*session, 1, {{"clientType", empty ? 8 : 9}});
    start(*session);
    Kept<std::optional<std::string>, std::optional<OrvantaError>> kept;
    session->flushMessagesWithCompletion(kept.reply());
    ASSERT_TRUE(kept.given());
    EXPECT_EQ(kept.get<0>(), std::nullopt);
    EXPECT_EQ(kept.get<1>(), makeOrvantaError("No backends available to send message", -1));
  }
}

TEST_F(SessionIntakeTest, AFlushOfBackendsWithoutBatchesAnswersAtOnceWithNothing) {
  const auto session = started();
  Kept<std::optional<std::string>, std::optional<OrvantaError>> kept;
  session->flushMessagesWithCompletion(kept.reply());
  ASSERT_TRUE(kept.given());
  EXPECT_EQ(kept.get<0>(), std::nullopt);
  EXPECT_EQ(kept.get<1>(), std::nullopt);
}

TEST_F(SessionIntakeTest, TheFirstErrorOfAnyBackendAnswersAFlush) {
  const Dictionary clients{{"clients", Array{Dictionary{{"post_url", "http://127.0.0.1/x"}}}}};
  storebag = shared(Dictionary{{"http_post", clients}, {"http_post2", clients}, {"voltmark", Dictionary{}}});
  const auto session = started();
  Kept<std::optional<std::string>, std::optional<OrvantaError>> kept;
  session->flushMessagesWithCompletion(kept.reply());
  ASSERT_TRUE(kept.given());
  EXPECT_EQ(kept.get<1>(), makeOrvantaError("Nothing to flush", -1));
  EXPECT_EQ(log.count("<7>internalFlushMessagesWithCompletion: "), 3U) << "the others still count";
}

TEST_F(SessionIntakeTest, UploadsThatNobodyTakesAreAnsweredNo) {
  const auto session = started();
  Kept<bool> file;
  session->uploadFileAtPath("file:///tmp/a%20b.log", std::nullopt, file.reply());
  EXPECT_FALSE(file.get());
  EXPECT_TRUE(log.contains("<3>uploadFileWithURL: File upload failed for /tmp/a b.log"));
  EXPECT_NE(messageLog().find("[uploadFileWithURL] Upload failed for file file:///tmp/a%20b.log"), std::string::npos);
  Kept<bool, std::optional<OrvantaError>> data;
  session->uploadLogData(std::make_shared<const Array>(Array{1}), data.reply());
  EXPECT_FALSE(data.get<0>());
  EXPECT_EQ(data.get<1>(), std::nullopt);
  EXPECT_TRUE(log.contains("<3>uploadLogData: Log data array upload failed"));
}

}  // namespace
}  // namespace orvanta::test
