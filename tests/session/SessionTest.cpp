#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "tests/support/SessionFixture.h"
#include "tests/support/UdpServer.h"

namespace orvanta::test {
namespace {

class SessionSetupTest : public SessionFixture {
 protected:
  static std::optional<std::string> displayURL(OrvantadSession& session) {
    KeptText url;
    session.fetchDisplayURL(url.reply());
    return url.get();
  }
};

TEST_F(SessionSetupTest, WithoutAStorebagThereIsNothingToReportTo) {
  const auto session = makeSession();
  storebag = shared({{"voltmark", Dictionary{}}});
  configure(*session, 7);
  EXPECT_EQ(start(*session), std::vector<std::string>{"voltmark"});
  storebag = nullptr;
  configure(*session, 7, {{"clientType", 6}});
  EXPECT_EQ(start(*session), std::nullopt);
  EXPECT_EQ(session->backends(), nullptr);
  EXPECT_EQ(send(*session, {{"category", 1}, {"type", 1}}), std::nullopt);
  EXPECT_TRUE(log.contains("<7>sendMessageWithDictionary: No backends available to send message"));
  EXPECT_EQ(displayURL(*session), "URL not available");
}

TEST_F(SessionSetupTest, OnlyReportingBackendsAreNamed) {
  maxAge = 0;
  storebag = shared({{"telegraph", Dictionary{}}});
  const auto session = makeSession();
  configure(*session, 7, {{"requireUserInfo", true}});
  EXPECT_EQ(start(*session), std::vector<std::string>{}) << "an empty list, not nullopt";
  EXPECT_TRUE(log.contains("<3>OrvantaBackend(newBackendWithName): telegraph"));
  storebag = shared({{"voltmark", Dictionary{}},
                     {"http_post", Dictionary{{"clients", Array{}}, {"display_url", "http://show"}}},
                     {"http_post2", Dictionary{{"no clients", 1}}}});
  const auto other = makeSession();
  configure(*other, 7, {{"requireUserInfo", true}});
  EXPECT_EQ(start(*other), std::vector<std::string>{"voltmark"}) << "http_post waits for user info";
  EXPECT_TRUE(log.contains("<3>OrvantaBackend(newBackendWithName): http_post2"));
  EXPECT_EQ(displayURL(*other), "http://show");
}

TEST_F(SessionSetupTest, TheDisplayURLComesFromTheHTTPSBackendsThenFromTheDashboard) {
  const auto backend = [](bool hasURL, const char* name, Dictionary profile) {
    if (hasURL) profile.set("display_url", std::string("http://") + name);
    return profile;
  };
  const struct {
    bool first, second, dashboard;
    const char* expected;
  } rows[] = {{true, true, true, "http://first"},
              {false, true, true, "http://second"},
              {false, false, true, "http://dashboard"},
              {false, false, false, "URL not available"}};
  maxAge = 0;
  for (const auto& row : rows) {
    storebag = shared({{"http_post", backend(row.first, "first", {{"clients", Array{}}})},
                       {"http_post2", backend(row.second, "second", {{"clients", Array{}}})},
                       {"dashboard", backend(row.dashboard, "dashboard", {{"ip", "127.0.0.1"}, {"port", 9}})},
                       {"upload_server", backend(true, "upload", {{"post_url", "http://127.0.0.1/x"}})}});
    const auto session = makeSession();
    configure(*session, 1);
    start(*session);
    ASSERT_EQ(std::distance(session->backends()->begin(), session->backends()->end()), 4);
    EXPECT_EQ(displayURL(*session), row.expected);
  }
}

TEST_F(SessionSetupTest, BackendsGetTheSessionsAndTheDevicesFacts) {
  device.device.release = "Internal";
  storebag = shared(Dictionary{{"voltmark", Dictionary{}}});
  const auto session = makeSession();
  configure(*session, 4'000'000'000U,
            {{"clientType", 9}, {"clientVersion", 0x12345}, {"requireUserInfo", true}, {"batchEvent", 1}});
  start(*session);
  const auto* backend = session->backends()->find("voltmark");
  ASSERT_NE(backend, nullptr);
  const auto& identity = backend->identity();
  EXPECT_EQ(identity.sessionID, 4'000'000'000U);
  EXPECT_EQ(identity.clientType, 9);
  EXPECT_EQ(identity.clientVersion, 0x2345);
  EXPECT_TRUE(identity.isInternal && identity.requireUserInfo && backend->batchEvents());
  EXPECT_EQ(backend->combinedSessionIDString(), session->sessionIDString());
}

TEST_F(SessionSetupTest, ChangesOfUserInfo) {
  const SharedDictionary none;
  const auto a = shared({{"clientName", "c"}, {"serviceName", "s"}});
  const auto sameNames = shared({{"clientName", "c"}, {"serviceName", "s"}, {"x", 1}});
  const auto other = shared({{"clientName", "d"}, {"serviceName", "s"}});
  const auto noService = shared({{"clientName", "c"}});
  const struct {
    const char* what;
    bool required;
    SharedDictionary before, given, after;
    bool evaluated;
  } rows[] = {
      {"none to none", true, none, none, none, false},
      {"first one", true, none, a, a, true},
      {"clearing what is required is ignored", true, a, none, a, false},
      {"clearing what is not required", false, a, none, none, true},
      {"same names", true, a, sameNames, sameNames, false},
      {"another client", true, a, other, other, true},
      {"a name that is missing on both sides counts as different", true, noService, noService, noService, true},
  };
  for (const auto& row : rows) {
    log.clear();
    const auto session = makeSession();
    configure(*session, 1, {{"requireUserInfo", row.required}}, row.before);
    EXPECT_EQ(log.contains("<4>setSessionInfo: Configure session: user info provided without requiring it"),
              row.before != nullptr && !row.required);
    EXPECT_EQ(session->userInfo(), row.before);
    session->fetchStatesWithUserInfo(row.given, {});
    EXPECT_EQ(session->userInfo(), row.after) << row.what;
    EXPECT_EQ(log.contains("receivedUserInfo: Received new user info for session 1"), row.evaluated) << row.what;
  }
}

TEST_F(SessionSetupTest, ATeardownWithoutBackendsSendsNothingAndEndsOnce) {
  const auto session = makeSession();
  configure(*session, 3);
  for (int i = 0; i < 2; ++i) leave(session);
  EXPECT_EQ(log.count("<7>dealloc: OrvantadSession dealloc: 3"), 1U);
  EXPECT_TRUE(device.http.requests().empty());
}

// Events through a session whose power-log backend shows what reached the backends.
class SessionIntakeTest : public SessionFixture {
 protected:
  const Dictionary kClients{{"clients", Array{Dictionary{{"post_url", "http://127.0.0.1/x"}}}}};
  SessionIntakeTest() { storebag = shared(Dictionary{{"voltmark", Dictionary{}}}); }

  std::shared_ptr<OrvantadSession> started() {
    auto session = makeSession();
    configure(*session, 11, {}, nullptr, true);
    start(*session);
    device.powerLog.records.clear();
    connections.back()->received->frames.clear();
    return session;
  }
  UdpServer dashboardServer;

  std::string messageLog() {
    std::string content;
    const auto directory = device.get().files().stateDirectory + "/Logs/Faultline/Retired";
    for (const auto& file : std::filesystem::directory_iterator(directory)) {
      std::ifstream in(file.path());
      content.append(std::istreambuf_iterator<char>(in), {});
    }
    return content;
  }
};

TEST_F(SessionIntakeTest, MandatoryParametersAreNumbers) {
  const auto session = started();
  const std::pair<Dictionary, std::string> rows[] = {{{}, "category"},
                                                     {{{"type", 1}}, "category"},
                                                     {{{"category", 1}}, "type"},
                                                     {{{"category", "1"}, {"type", 1}}, "category"},
                                                     {{{"category", 1}, {"type", Array{}}}, "type"}};
  for (const auto& [parameters, missing] : rows) {
    log.clear();
    EXPECT_EQ(send(*session, parameters), std::nullopt);
    EXPECT_EQ(log.count("Missing mandatory parameter"), 1U);
    EXPECT_TRUE(log.contains("<7>sendMessageWithDictionary: Missing mandatory parameter '" + missing + "'"));
  }
  EXPECT_TRUE(device.powerLog.records.empty());
  EXPECT_TRUE(connections.back()->aggregated().empty());
}

TEST_F(SessionIntakeTest, NumbersAreCutToSixteenBitsAndAggregatedWithTheirTime) {
  const auto session = started();
  const std::pair<Value, int> rows[] = {{65537, 1}, {65536 + 77, 77}, {-1, 65535}, {3.9, 3}, {4294967297LL, 1}};
  for (const auto& [category, expected] : rows) {
    device.powerLog.records.clear();
    send(*session, {{"category", category}, {"type", 65538}, {"payload", Dictionary{{"x", 1}}}});
    ASSERT_EQ(device.powerLog.records.size(), 1U) << category.description();
    EXPECT_EQ(*device.powerLog.records[0].record.find("method"), Value(expected));
    EXPECT_EQ(*device.powerLog.records[0].record.find("respCode"), Value(2));
  }
  // 65536 is category 0, which the power log never sees; the aggregating client does.
  device.clock.set(1'700'000'123.25);
  send(*session, {{"category", 65536}, {"type", 9}, {"payload", Dictionary{{"a", 1}}}});
  EXPECT_EQ(device.powerLog.records.size(), 1U);
  ASSERT_EQ(connections.back()->aggregated().size(), std::size(rows) + 1);
  const auto event = connections.back()->aggregated().back();
  EXPECT_EQ(event.category, 0);
  EXPECT_EQ(event.type, 9);
  EXPECT_EQ(event.timestamp, 1'700'000'123.25);
  EXPECT_TRUE(log.contains("<6>getAncestorWithAggregatorForSession: No user info found for session 11"));
  EXPECT_EQ(*event.payload, (Dictionary{{"a", 1}}));
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

  const auto other = started();
  connections.back()->received->closed = true;
  log.clear();
  send(*other, {{"category", 3}, {"type", 4}});
  EXPECT_EQ(log.count("<3>sendMessageWithDictionary: Failed to get remote object proxy: the connection is closed"), 1U);
  EXPECT_EQ(log.count("Dropping aggregated events"), 0U) << "one that has gone is not taken for a slow one";
}

TEST_F(SessionIntakeTest, TheLastHTTPSTextOrElseNothingBecomesTheReply) {
  device.device.consent = true;
  storebag = shared({{"http_post", kClients}, {"voltmark", Dictionary{}}});
  const auto session = started();
  const auto reply = send(*session, {{"category", 3}, {"type", 4}, {"payload", Dictionary{{"greeting", "hello"}}}});
  ASSERT_TRUE(reply);
  EXPECT_NE(reply->find("hello"), std::string::npos);
  EXPECT_NE(messageLog().find("[http_post -> sendMessageWithDictionary] " + *reply), std::string::npos);
  EXPECT_EQ(messageLog().find("[voltmark"), std::string::npos);
}

TEST_F(SessionIntakeTest, ADashboardsLineBecomesTheReplyForWantOfAnHTTPSText) {
  device.device.consent = true;
  const Dictionary dashboard{{"ip", "127.0.0.1"}, {"port", static_cast<int>(dashboardServer.port())}};
  maxAge = 0;
  const auto replyOf = [&](Dictionary bag, bool promisesUserInfo = false) {
    storebag = shared(std::move(bag));
    const auto session = makeSession();
    configure(*session, 11, {{"requireUserInfo", promisesUserInfo}});
    start(*session);
    return send(*session, {{"category", 3}, {"type", 4}, {"payload", Dictionary{{"greeting", "hello"}}}})
        .value_or("none");
  };
  const std::string line = replyOf({{"dashboard", dashboard}, {"voltmark", Dictionary{}}});
  EXPECT_NE(line.find("3     4  greeting=hello"), std::string::npos) << line;
  const std::string text = replyOf({{"dashboard", dashboard}, {"http_post2", kClients}});
  EXPECT_NE(text.find("hello"), std::string::npos) << text;
  EXPECT_EQ(text.find("greeting=hello"), std::string::npos) << text;
  const std::string left = replyOf({{"dashboard", dashboard}, {"http_post", kClients}}, true);  // which gives no text
  EXPECT_NE(left.find("greeting=hello"), std::string::npos) << left;
  EXPECT_EQ(replyOf({{"voltmark", Dictionary{}}}), "none");
}

TEST_F(SessionIntakeTest, AOneOffEventNeedsIdentifiersAndGoesThroughBackendsOfItsOwn) {
  const auto session = makeSession();
  for (const auto& info : {Dictionary{{"sessionID", 1}}, Dictionary{{"clientType", 5}}, Dictionary{}}) {
    KeptText kept;
    session->sendMessageWithSessionInfo(shared(info), nullptr, 1, 1, nullptr, kept.reply());
    EXPECT_EQ(kept.error(), "the reply was dropped without being given");
  }
  EXPECT_EQ(log.count("<3>sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo"), 3U);

  KeptText kept;
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
  KeptText none;
  session->sendMessageWithSessionInfo(shared({{"sessionID", 9}, {"clientType", 6}}), nullptr, 6, 7, nullptr,
                                      none.reply());
  EXPECT_EQ(none.get(), "storebag not available");
}

TEST_F(SessionIntakeTest, AFlushAnswersAtOnceWhereThereIsNothingWithTheFirstErrorOfAnyBackend) {
  const char* const noBackends = "No backends available to send message";
  const Dictionary three{{"http_post", kClients}, {"http_post2", kClients}, {"voltmark", Dictionary{}}};
  const std::tuple<SharedDictionary, const char*, std::size_t> rows[] = {
      {nullptr, noBackends, 1},
      {shared({}), noBackends, 1},
      {shared({{"voltmark", Dictionary{}}}), nullptr, 1},
      {shared(three), "Nothing to flush", 3},  // the others still count
  };
  maxAge = 0;
  std::int32_t clientType = 5;  // a storebag of its own for each
  for (const auto& [bag, error, flushed] : rows) {
    storebag = bag;
    const auto session = makeSession();
    configure(*session, 1, {{"clientType", ++clientType}});
    start(*session);
    log.clear();
    KeptFlush kept;
    session->flushMessagesWithCompletion(kept.reply());
    ASSERT_TRUE(kept.given());
    EXPECT_EQ(kept.get<0>(), std::nullopt);
    EXPECT_EQ(kept.get<1>(), error == nullptr ? std::nullopt : std::optional(makeOrvantaError(error, -1)));
    EXPECT_EQ(log.count("<7>internalFlushMessagesWithCompletion: "), flushed);
  }
}

TEST_F(SessionIntakeTest, UploadsThatNoBackendTakesAreAnsweredNo) {
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
