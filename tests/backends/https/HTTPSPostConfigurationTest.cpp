#include <gtest/gtest.h>

#include "tests/backends/https/HTTPSFixture.h"

namespace orvanta::test {
namespace {

class HTTPSPostConfigurationTest : public HTTPSFixture {
 protected:
  // The URL to which an event with that flag goes; nullopt when no post was made.
  std::optional<std::string> urlOf(HTTPSPostBackend& backend, std::int32_t flag) {
    platform.http.clear();
    send(backend, 1, flag);
    const auto posted = requests();
    return posted.empty() ? std::nullopt : std::optional<std::string>(posted.back().url);
  }
};

TEST_F(HTTPSPostConfigurationTest, LinesOfAnEvaluation) {
  const Array byCountry{Dictionary{{"country", Array{"DE"}}, {"threshold", 0.5}}};
  Setup setup = requiring({{"expedite", 0},
                           {"sampling_threshold", 0.25},
                           {"per_country_sampling_thresholds", byCountry},
                           {"event_whitelist", Array{3, 4}},
                           {"event_blacklist", Array{5}},
                           {"extras_on_internal", 1},
                           {"realtime_post_url", nullptr}});
  setup.evaluate = false;
  setup.samplingFactor = 0.75;
  const auto backend = makeBackend(setup);
  const LogCapture log;
  backend->updateState();
  EXPECT_EQ(backend->state(), kBackendHeld);
  const std::string prefix = "<7>HTTPSPostBackend(updateBackendState): ";
  const std::string link = "<7>HTTPSPostBackend(updatePostLink): ", url = "'https://events.example/batch'";
  EXPECT_EQ(log.lines(), (std::vector<std::string>{
                             prefix + "Store bag override  _batchEvent=1",
                             prefix + "sampling threshold for DE changed from 0.25 to 0.50",
                             "<7>resetBackendStateWithClient: event_threshold set to 49",
                             "<7>setBackendStateWithClient: extras on internal is set to 1",
                             prefix + "http_post: client found Mail:imap, state=3, samplingFactor=0.750000",
                             link + "Storebag " + url + " for postURL",
                             link + "realtimePostURL defaults to postURL " + url,
                             prefix + "http_post: eventWhitelist=" + Value(Array{3, 4}).description(),
                             prefix + "http_post: eventBlacklist=" + Value(Array{5}).description(),
                         }));
  EXPECT_TRUE(backend->batchEvents());
  EXPECT_EQ(backend->samplingThreshold(), 0.5);
  EXPECT_TRUE(backend->isWhitelistedEvent(3) && !backend->isWhitelistedEvent(9) && backend->isBlacklistedEvent(5));
  EXPECT_EQ(backend->reason()->test, ReportingTest::heldBySampling);
}

TEST_F(HTTPSPostConfigurationTest, AMalformedSectionIsAWarningAndDisables) {
  Setup setup = requiring({{"filters", "none"}});
  setup.evaluate = false;
  const auto backend = makeBackend(setup);
  const LogCapture log;
  backend->updateState();
  EXPECT_EQ(backend->state(), kBackendDisabled);
  EXPECT_EQ(backend->postURL(), std::nullopt);
  EXPECT_EQ(log.lines(), Posts{"<4>HTTPSPostBackend(updateBackendState): client section 0 is malformed: \"filters\" is "
                               "no list."});
}

TEST_F(HTTPSPostConfigurationTest, WhatIsNotTakenAnewStays) {
  const Array removeSecret{Dictionary{{"key", "secret"}, {"action", "remove"}}};
  const Dictionary first = openSection({{"client", "Mail"}, {"event_blacklist", Array{5}}, {"filters", removeSecret}});
  // A section that refuses, and one whose filters are an empty list.
  for (const Dictionary& second : {Dictionary{{"override_dnu", 0}}, openSection({{"filters", Array{}}})}) {
    platform.http.clear();
    Setup setup = requiring();
    setup.profile = profileOf({first, second});
    const auto backend = makeBackend(setup);
    ASSERT_EQ(backend->state(), kBackendEnabled);
    backend->setUserInfoDict(shared({{"clientName", "News"}}));
    backend->updateState();
    EXPECT_EQ(backend->state(), second.size() == 1 ? kBackendDisabled : kBackendEnabled);
    EXPECT_EQ(backend->postURL(), "https://events.example/batch");
    EXPECT_TRUE(backend->isBlacklistedEvent(5));
    backend->setState(kBackendEnabled);  // as from a parent session
    send(*backend, 1, 1, shared({{"secret", "x"}, {"open", "y"}}));
    EXPECT_EQ(fields("secret"), Posts{"none"});
    EXPECT_EQ(fields("open"), Posts{"y"});
  }
}

TEST_F(HTTPSPostConfigurationTest, TheLastVisitedSectionDecidesTheRealtimeURL) {
  Setup setup;
  const Dictionary realtimeOnly{{"realtime_post_url", "https://r0.example"}};
  setup.profile = profileOf({realtimeOnly, Dictionary{{"post_url", "https://p1.example"}},
                             Dictionary{{"realtime_post_url", "https://r2.example"}}});
  EXPECT_EQ(urlOf(*makeBackend(setup), 1), "https://p1.example");

  setup.profile = profileOf({realtimeOnly});
  const auto withoutPostURL = makeBackend(setup);
  EXPECT_EQ(urlOf(*withoutPostURL, 1), "https://r0.example");
  EXPECT_EQ(urlOf(*withoutPostURL, 0), std::nullopt);
}

TEST_F(HTTPSPostConfigurationTest, URLsOfTheUserDefaults) {
  const LogCapture log;
  const std::string line = "<7>HTTPSPostBackend(initWithName): Using user default ";
  ASSERT_TRUE(platform.get().defaults().set("httpsPostURL", "https://default.example").ok());
  EXPECT_EQ(urlOf(*makeBackend(batching()), 1), "https://events.example/realtime");
  EXPECT_EQ(urlOf(*makeBackend({}), 0), "https://default.example");
  EXPECT_TRUE(log.contains(line + "'https://default.example' for postURL"));
  EXPECT_TRUE(log.contains("event_threshold set to 0")) << "no section supplied the URL";

  ASSERT_TRUE(platform.get().defaults().set("httpsRealtimePostURL", "https://now.example").ok());
  EXPECT_EQ(urlOf(*makeBackend({}), 1), "https://now.example");
  EXPECT_TRUE(log.contains(line + "'https://now.example' for realtimePostURL"));
}

TEST_F(HTTPSPostConfigurationTest, ClientIdentifiers) {
  const struct {
    const char* what;
    bool consent;
    int overrideDnu;
    bool custom, extras, isInternal;
    std::string key;  // of the user default that holds the identifier; empty: the device's own
  } rows[] = {
      {"consent respected", true, 0, false, false, false, "uuid-respect-dnu"},
      {"overridden, given", true, 1, false, false, false, "uuid-override-dnu"},
      {"custom", true, 0, true, false, false, "uuid:Mail:imap"},
      {"custom, overridden", false, 1, true, false, false, "uuid:Mail:imap"},
      {"extras on an internal device", true, 0, true, true, true, ""},
      {"extras elsewhere", true, 0, true, true, false, "uuid:Mail:imap"},
      {"no extras on an internal device", true, 0, false, false, true, "uuid-respect-dnu"},
  };
  for (const auto& row : rows) {
    platform.http.clear();
    platform.device.consent = row.consent;
    Setup setup = requiring({{"override_dnu", row.overrideDnu},
                             {"extras_on_internal", row.extras ? 1 : 0},
                             {"custom_clientId", row.custom ? Value(false) : Value()}});
    setup.identity.isInternal = row.isInternal;
    send(*makeBackend(setup), 1);
    EXPECT_EQ(*envelopeOf(requests().at(0)).find("clientId")->string(),
              row.key.empty() ? setup.identity.deviceID : platform.get().defaults().text(row.key).value_or("(none)"))
        << row.what;
  }
}

}  // namespace
}  // namespace orvanta::test
