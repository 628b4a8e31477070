#include <gtest/gtest.h>

#include "platform/Json.h"
#include "tests/backends/HTTPSFixture.h"

namespace orvanta::test {
namespace {

class HTTPSPostConfigurationTest : public HTTPSFixture {
 protected:
  static Setup requiring(Dictionary section) {
    Setup setup;
    setup.profile = profileOf({Value(std::move(section))});
    setup.identity.requireUserInfo = true;
    setup.userInfo = shared({{"clientName", "Mail"}, {"serviceName", "imap"}});
    return setup;
  }
  // Where an event with that flag goes; none when no post was made.
  std::optional<std::string> urlOf(HTTPSPostBackend& backend, std::int32_t flag) {
    platform.http.clear();
    send(backend, 1, flag);
    const auto posted = requests();
    return posted.empty() ? std::nullopt : std::optional<std::string>(posted.back().url);
  }
};

TEST_F(HTTPSPostConfigurationTest, RefusesProfilesWithoutClients) {
  const LogCapture log;
  const std::string line = "<3>HTTPSPostBackend(initWithName): can't find the client list.";
  EXPECT_EQ(HTTPSPostBackend::create(platform, "http_post", nullptr, "Parva"), nullptr);
  EXPECT_EQ(HTTPSPostBackend::create(platform, "http_post", shared(profileOf({})), ""), nullptr);
  EXPECT_EQ(log.count(line), 0U);
  EXPECT_EQ(HTTPSPostBackend::create(platform, "http_post", shared({}), "Parva"), nullptr);
  EXPECT_EQ(HTTPSPostBackend::create(platform, "http_post", shared({{"clients", "Mail"}}), "Parva"), nullptr);
  EXPECT_EQ(log.count(line), 2U);
}

TEST_F(HTTPSPostConfigurationTest, LinesOfAnEvaluation) {
  Dictionary section = openSection();
  section.set("expedite", 0);
  section.set("sampling_threshold", 0.25);
  section.set("per_country_sampling_thresholds",
              Array{Value(Dictionary{{"country", Array{"DE"}}, {"threshold", 0.5}})});
  section.set("event_whitelist", Array{3, 4});
  section.set("event_blacklist", Array{5});
  section.set("extras_on_internal", 1);
  section.erase("realtime_post_url");
  Setup setup = requiring(section);
  setup.evaluate = false;
  setup.samplingFactor = 0.75;
  const auto backend = makeBackend(setup);
  const LogCapture log;
  backend->updateState();
  EXPECT_EQ(backend->state(), kBackendSampledOut);
  const std::string prefix = "<7>HTTPSPostBackend(updateBackendState): ";
  const std::vector<std::string> expected{
      prefix + "Store bag override  _batchEvent=1",
      prefix + "sampling threshold for DE changed from 0.25 to 0.50",
      "<7>resetBackendStateWithClient: event_threshold set to 49",
      "<7>setBackendStateWithClient: extras on internal is set to 1",
      prefix + "http_post: client found Mail:imap, state=3, samplingFactor=0.750000",
      "<7>HTTPSPostBackend(updatePostLink): Storebag 'https://events.example/batch' for postURL",
      "<7>HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL 'https://events.example/batch'",
      prefix + "http_post: eventWhitelist=" + Value(Array{3, 4}).description(),
      prefix + "http_post: eventBlacklist=" + Value(Array{5}).description(),
  };
  EXPECT_EQ(log.lines(), expected);
  EXPECT_TRUE(backend->batchEvents());
  EXPECT_EQ(backend->samplingThreshold(), 0.5);
  EXPECT_TRUE(backend->isWhitelistedEvent(3));
  EXPECT_FALSE(backend->isWhitelistedEvent(9));
  EXPECT_TRUE(backend->isBlacklistedEvent(5));
  EXPECT_EQ(backend->reason()->test, ReportingTest::held);
}

TEST_F(HTTPSPostConfigurationTest, LinesOfRefusals) {
  struct Row {
    const char* key;
    Value value;  // null: erased
    std::string line;
  };
  const std::string prefix = "HTTPSPostBackend(updateBackendState): ";
  const Row rows[] = {
      {"override_dnu", 0, "<7>" + prefix + "reporting disabled by DNU: 0."},
      {"override_dnu", nullptr, "<7>" + prefix + "reporting disabled by DNU: 0."},
      {"locale_whitelist", Array{"FR"},
       "<7>" + prefix + "(DE) isn't in country code list " + Value(Array{"FR"}).description()},
      {"locale_whitelist", nullptr, "<7>" + prefix + "(DE) isn't in country code list (null)"},
      {"device_whitelist", Array{"Magna"},
       "<7>" + prefix + "(Parva) isn't in device whitelist " + Value(Array{"Magna"}).description()},
      {"device_blacklist", Array{"parva3"},
       "<7>" + prefix + "(Parva3,2) is in device blacklist " + Value(Array{"parva3"}).description()},
      {"filters", nullptr, "<4>" + prefix + "filters are required."},
      {"filters", "none", "<4>" + prefix + "client section 0 is malformed: \"filters\" is no list."},
  };
  for (const auto& row : rows) {
    Dictionary section = openSection();
    section.erase(row.key);
    if (!row.value.isNull()) section.set(row.key, row.value);
    Setup setup = requiring(section);
    setup.evaluate = false;
    const auto backend = makeBackend(setup);
    const LogCapture log;
    backend->updateState();
    EXPECT_EQ(backend->state(), kBackendDisabled) << row.line;
    EXPECT_EQ(log.lines(), std::vector<std::string>{row.line});
    EXPECT_EQ(backend->postURL(), std::nullopt) << row.line;
  }
}

TEST_F(HTTPSPostConfigurationTest, ARefusalKeepsWhatEarlierEvaluationsTook) {
  Dictionary section = openSection();
  section.set("client", "Mail");
  section.set("event_blacklist", Array{5});
  section.set("filters", Array{Value(Dictionary{{"key", "secret"}, {"action", "remove"}})});
  Dictionary refused{{"override_dnu", 0}};
  Setup setup = requiring(section);
  setup.profile = profileOf({Value(section), Value(refused)});
  const auto backend = makeBackend(setup);
  ASSERT_EQ(backend->state(), kBackendEnabled);
  backend->setUserInfoDict(shared({{"clientName", "News"}}));
  backend->updateState();
  EXPECT_EQ(backend->state(), kBackendDisabled);
  EXPECT_EQ(backend->postURL(), "https://events.example/batch");
  EXPECT_TRUE(backend->isBlacklistedEvent(5));
  backend->setState(kBackendEnabled);  // as from a parent session
  send(*backend, 1, 1, shared({{"secret", "x"}, {"open", "y"}}));
  const auto events = postedEvents(requests().at(0));
  EXPECT_FALSE(events.at(0).dictionary()->contains("secret")) << "and its filters";
}

TEST_F(HTTPSPostConfigurationTest, EmptyFiltersKeepTheEarlierOnes) {
  Dictionary first = openSection();
  first.set("client", "Mail");
  first.set("filters", Array{Value(Dictionary{{"key", "secret"}, {"action", "remove"}})});
  Dictionary second = openSection();
  second.set("filters", Array{});
  Setup setup = requiring(first);
  setup.profile = profileOf({Value(first), Value(second)});
  const auto backend = makeBackend(setup);
  backend->setUserInfoDict(shared({{"clientName", "News"}}));
  backend->updateState();
  send(*backend, 1, 0, shared({{"secret", "x"}}));
  EXPECT_FALSE(postedEvents(requests().at(0)).at(0).dictionary()->contains("secret"));
}

TEST_F(HTTPSPostConfigurationTest, TheLastVisitedSectionDecidesTheRealtimeURL) {
  Setup setup;
  setup.profile = profileOf({Value(Dictionary{{"realtime_post_url", "https://r0.example"}}),
                             Value(Dictionary{{"post_url", "https://p1.example"}}),
                             Value(Dictionary{{"realtime_post_url", "https://r2.example"}})});
  const auto backend = makeBackend(setup);
  EXPECT_EQ(urlOf(*backend, 1), "https://p1.example");

  setup.profile = profileOf({Value(Dictionary{{"realtime_post_url", "https://r0.example"}})});
  const auto withoutPostURL = makeBackend(setup);
  EXPECT_EQ(withoutPostURL->state(), kBackendEnabled);
  EXPECT_EQ(urlOf(*withoutPostURL, 1), "https://r0.example");
  EXPECT_EQ(urlOf(*withoutPostURL, 0), std::nullopt);
}

TEST_F(HTTPSPostConfigurationTest, URLsOfTheUserDefaults) {
  ASSERT_TRUE(platform.get().defaults().set("httpsPostURL", "https://default.example").ok());
  const LogCapture log;
  Setup setup;
  setup.batchEvents = true;
  const auto backend = makeBackend(setup);
  EXPECT_TRUE(
      log.contains("<7>HTTPSPostBackend(initWithName): Using user default 'https://default.example' for postURL"));
  EXPECT_EQ(urlOf(*backend, 1), "https://events.example/realtime");
  EXPECT_EQ(backend->postURL(), "https://default.example");
  EXPECT_TRUE(log.contains("event_threshold set to 0")) << "no section supplied the URL";

  ASSERT_TRUE(platform.get().defaults().set("httpsRealtimePostURL", "https://now.example").ok());
  const auto both = makeBackend({});
  EXPECT_TRUE(
      log.contains("<7>HTTPSPostBackend(initWithName): Using user default 'https://now.example' for realtimePostURL"));
  EXPECT_EQ(urlOf(*both, 1), "https://now.example");
  EXPECT_EQ(urlOf(*both, 0), "https://default.example");
}

TEST_F(HTTPSPostConfigurationTest, ClientIdentifiers) {
  struct Row {
    const char* what;
    bool consent;
    Value overrideDnu;
    bool custom;
    int extras;
    bool isInternal;
    std::string expected;  // "respect", "override", "custom", or the identifier itself
  };
  const std::string udid = defaultIdentity().udid;
  const Row rows[] = {
      {"consent respected", true, 0, false, 0, false, "respect"},
      {"overridden, not given", false, 1, false, 0, false, "override"},
      {"overridden, given", true, 1, false, 0, false, "override"},
      {"custom", true, 0, true, 0, false, "custom"},
      {"custom, overridden", false, 1, true, 0, false, "custom"},
      {"extras on an internal device", true, 0, true, 1, true, udid},
      {"extras elsewhere", true, 0, true, 1, false, "custom"},
      {"no extras on an internal device", true, 0, false, 0, true, "respect"},
  };
  for (const auto& row : rows) {
    platform.device.consent = row.consent;
    Dictionary section = openSection();
    section.set("override_dnu", row.overrideDnu);
    section.set("extras_on_internal", row.extras);
    if (row.custom) section.set("custom_clientId", false);
    Setup setup = requiring(section);
    setup.identity.isInternal = row.isInternal;
    const auto backend = makeBackend(setup);
    platform.http.clear();
    send(*backend, 1);
    const auto body = platform::parseJson(plainBody(requests().at(0)));
    const std::string clientID = *body->dictionary()->find("clientId")->string();
    const auto stored = [&](const char* key) { return platform.get().defaults().text(key).value_or("(none)"); };
    std::string expected = row.expected;
    if (expected == "respect") expected = stored("uuid-respect-dnu");
    if (expected == "override") expected = stored("uuid-override-dnu");
    if (expected == "custom") expected = stored("uuid:Mail:imap");
    EXPECT_EQ(clientID, expected) << row.what;
  }
}

TEST_F(HTTPSPostConfigurationTest, EvaluationFollowsTheUserInfo) {
  Setup setup = requiring(openSection());
  setup.userInfo = nullptr;
  const auto backend = makeBackend(setup);
  EXPECT_EQ(backend->state(), kBackendWaiting);
  backend->setUserInfoDict(shared({}));
  backend->updateState();
  EXPECT_EQ(backend->state(), kBackendEnabled) << "empty user info is user info";
}

}  // namespace
}  // namespace orvanta::test
