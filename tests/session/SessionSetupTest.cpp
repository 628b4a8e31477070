#include <gtest/gtest.h>

#include "session/FileURL.h"
#include "tests/support/SessionFixture.h"

namespace orvanta::test {
namespace {

class SessionSetupTest : public SessionFixture {
 protected:
  // The first record of the power log with that type; the session's own records have category 0 and never reach it, so
  // bookkeeping is looked at in the posts.
  std::vector<platform::HttpRequest> posts() { return device.http.requests(); }
};

TEST_F(SessionSetupTest, IdentifiersAreDistinctBase64OfSixteenBytes) {
  const auto a = makeSession();
  const auto b = makeSession();
  EXPECT_NE(a->sessionIDString(), b->sessionIDString());
  EXPECT_EQ(a->sessionIDString().size(), 24U);
  EXPECT_EQ(a->sessionIDString().substr(22), "==");
}

TEST_F(SessionSetupTest, WithoutAStorebagThereIsNothingToReportTo) {
  const auto session = makeSession();
  configure(*session, 7);
  EXPECT_EQ(start(*session), std::nullopt);
  EXPECT_EQ(session->backends(), nullptr);
  EXPECT_EQ(send(*session, {{"category", 1}, {"type", 1}}), std::nullopt);
  EXPECT_TRUE(log.contains("<7>sendMessageWithDictionary: No backends available to send message"));
  Kept<std::optional<std::string>> url;
  session->fetchDisplayURL(url.reply());
  EXPECT_EQ(url.get(), "URL not available");
}

TEST_F(SessionSetupTest, NamesThatAreNoBackendGiveAnEmptyListNotNone) {
  storebag = shared(Dictionary{{"telegraph", Dictionary{}}});
  const auto session = makeSession();
  configure(*session, 7);
  EXPECT_EQ(start(*session), std::vector<std::string>{});
  EXPECT_TRUE(log.contains("<3>OrvantaBackend(newBackendWithName): telegraph"));
}

TEST_F(SessionSetupTest, OnlyReportingBackendsAreNamed) {
  storebag = shared(Dictionary{{"voltmark", Dictionary{}},
                               {"http_post", Dictionary{{"clients", Array{}}, {"display_url", "http://show"}}},
                               {"http_post2", Dictionary{{"no clients", 1}}}});
  const auto session = makeSession();
  configure(*session, 7, {{"requireUserInfo", true}});
  EXPECT_EQ(start(*session), std::vector<std::string>{"voltmark"}) << "http_post waits for user info";
  Kept<std::optional<std::string>> url;
  session->fetchDisplayURL(url.reply());
  EXPECT_EQ(url.get(), "http://show");
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
  EXPECT_EQ(identity.compType, 9);
  EXPECT_EQ(identity.clientVersion, 0x2345);
  EXPECT_EQ(identity.udid, *device.device.udid);
  EXPECT_EQ(identity.hardwareType, device.device.type);
  EXPECT_TRUE(identity.isInternal);
  EXPECT_TRUE(identity.requireUserInfo);
  EXPECT_TRUE(backend->batchEvents());
  EXPECT_EQ(backend->productFamily(), *device.device.name);
  EXPECT_EQ(backend->combinedSessionIDString(), session->sessionIDString());
}

TEST_F(SessionSetupTest, UserInfoThatNobodyAskedForIsKeptWithAWarning) {
  const auto session = makeSession();
  const auto user = shared(Dictionary{{"clientName", "c"}});
  configure(*session, 1, {}, user);
  EXPECT_EQ(session->userInfo(), user);
  EXPECT_TRUE(log.contains("<4>setSessionInfo: Configure session: user info provided without requiring it"));
}

TEST_F(SessionSetupTest, ChangesOfUserInfo) {
  const auto none = SharedDictionary();
  const auto a = shared(Dictionary{{"clientName", "c"}, {"serviceName", "s"}});
  const auto sameNames = shared(Dictionary{{"clientName", "c"}, {"serviceName", "s"}, {"x", 1}});
  const auto other = shared(Dictionary{{"clientName", "d"}, {"serviceName", "s"}});
  const auto noService = shared(Dictionary{{"clientName", "c"}});
  const struct {
    const char* what;
    bool required;
    SharedDictionary before;
    SharedDictionary given;
    SharedDictionary after;
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
    const auto session = makeSession();
    configure(*session, 1, {{"requireUserInfo", row.required}}, row.before);
    log.clear();
    session->fetchStatesWithUserInfo(row.given, {});
    EXPECT_EQ(session->userInfo(), row.after) << row.what;
    EXPECT_EQ(log.contains("receivedUserInfo: Received new user info for session 1"), row.evaluated) << row.what;
  }
}

TEST_F(SessionSetupTest, ATeardownWithoutBackendsSendsNothingAndEndsOnce) {
  const auto session = makeSession();
  configure(*session, 3);
  leave(session);
  leave(session);
  EXPECT_EQ(log.count("<7>dealloc: OrvantadSession dealloc: 3"), 1U);
  EXPECT_TRUE(posts().empty());
}

TEST(FileURLTest, OnlyWholeLocalFileURLsHaveAPath) {
  const struct {
    const char* url;
    std::optional<std::string> path;
  } rows[] = {
      {"file:///tmp/a", "/tmp/a"},
      {"file:///tmp/a%20b%25%c3%A4", "/tmp/a b%\xc3\xa4"},
      {"file://localhost/tmp/a", "/tmp/a"},
      {"file:///", "/"},
      {"file://", std::nullopt},
      {"file://host/tmp/a", std::nullopt},
      {"file:/tmp/a", std::nullopt},
      {"/tmp/a", std::nullopt},
      {"http:///tmp/a", std::nullopt},
      {"file:///tmp/%", std::nullopt},
      {"file:///tmp/%2", std::nullopt},
      {"file:///tmp/%zz", std::nullopt},
      {"file:///tmp/%00", std::nullopt},
      {"", std::nullopt},
  };
  for (const auto& row : rows) EXPECT_EQ(pathOfFileURL(row.url), row.path) << row.url;
}

}  // namespace
}  // namespace orvanta::test
