#include "backends/https/ReportingDecision.h"

#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <limits>

namespace orvanta {
namespace {
using Change = std::function<void(ReportingFacts&)>;
using enum ReportingTest;

// A section that refuses nothing by itself, with other keys, or without those given as null.
Dictionary open(const Dictionary& more = {}) {
  Dictionary section{{"locale_whitelist", Array{"DE"}},
                     {"filters", Array{Dictionary{{"key", "userName"}, {"action", "remove"}}}},
                     {"sampling_threshold", 0.25}};
  section.merge(more);
  for (const auto& [key, value] : more) {
    if (value.isNull()) section.erase(key);
  }
  return section;
}

// The session of Mail's imap service, user info and consent given, on a device whose draw is 0.2.
ReportingDecision decide(Array clients, const Change& change = {}) {
  ReportingFacts facts;
  facts.clientName = "Mail";
  facts.serviceName = "imap.service";
  facts.requireUserInfo = true;
  facts.hasUserInfo = true;
  facts.ownVersion = {2, 1, 5};
  facts.consentGiven = true;
  facts.countryCode = "DE";
  facts.productFamily = "Parva";
  facts.productType = "xABCy";
  facts.samplingFactor = 0.2;
  if (change) change(facts);
  return evaluate({{"clients", std::move(clients)}}, facts);
}

std::int32_t stateOf(ReportingTest test) {
  if (test == waitingForUserInfo) return 0;
  if (test == userInfoNotRequired || test == sampledIn) return 2;
  return test == heldBySampling ? 3 : 1;
}

void check(const char* what, const ReportingDecision& decision, ReportingTest test) {
  const std::string reason = describe(decision.reason);
  EXPECT_EQ(decision.reason.test, test) << what << ": " << reason;
  EXPECT_EQ(decision.state, stateOf(test)) << what << ": " << reason;
  EXPECT_FALSE(reason.empty()) << what;
}

// What becomes of one section.
struct Row {
  const char* what;
  Dictionary more;  // on top of open()
  ReportingTest test;
  Change change = {};
  std::string reason = {};  // empty: any
};
void check(std::initializer_list<Row> rows) {
  for (const auto& row : rows) {
    const auto decision = decide({open(row.more)}, row.change);
    check(row.what, decision, row.test);
    EXPECT_TRUE(row.reason.empty() || row.reason == describe(decision.reason)) << describe(decision.reason);
  }
}

const Change noClient = [](auto& facts) { facts.clientName.reset(); };
const Change noService = [](auto& facts) { facts.serviceName.reset(); };
const Change noConsent = [](auto& facts) { facts.consentGiven = false; };
const Change noCountry = [](auto& facts) { facts.countryCode.reset(); };
const Change noModel = [](auto& facts) { facts.productType.reset(); };
const Change notRequired = [](auto& facts) { facts.requireUserInfo = facts.consentGiven = false; };
const Change noUserInfo = [](auto& facts) { facts.hasUserInfo = false; };
Change draw(double factor) {
  return [factor](auto& facts) { facts.samplingFactor = factor; };
}

TEST(ReportingDecision, Sections) {
  const struct {
    const char* what;
    Array clients;
    ReportingTest test;
    Change change = {};
  } rows[] = {
      {"no sections", {}, noSectionMatches},
      {"user info not required, no consent, no match", {Dictionary{{"client", "x"}}}, userInfoNotRequired, notRequired},
      {"one of them a section", {"text", open()}, sampledIn},
      {"the first that matches decides",
       {open({{"client", "News"}}), open({{"sampling_threshold", 0.1}}), open()},
       heldBySampling},
      {"one that is too new is passed over", {open({{"enabledSince", "3"}}), open()}, sampledIn},
  };
  for (const auto& row : rows) check(row.what, decide(row.clients, row.change), row.test);
  for (const Dictionary& profile : {Dictionary{}, Dictionary{{"clients", "Mail"}}}) {
    check("no list", evaluate(profile, {}), noClientList);
  }
  const auto reason =
      decide({Dictionary{{"client", "x"}}, open({{"enabledSince", "3.1"}}), open({{"enabledSince", "4"}})}).reason;
  EXPECT_EQ(reason.section, 1U);
  EXPECT_EQ(reason.subject, "3.1");
}

TEST(ReportingDecision, SectionForTheClient) {
  const Change emptyClient = [](auto& facts) { facts.clientName = ""; };
  const Change blankClient = [](auto& facts) { facts.clientName = " mail"; };
  check({
      {"user info missing", {}, waitingForUserInfo, noUserInfo, "waiting for user info."},
      {"any client, client unknown", {}, sampledIn, noClient},
      {"client without case", {{"client", "News,mAIL"}}, sampledIn},
      {"client as a whole", {{"client", "Mai"}}, noSectionMatches, {}, "no client section matches."},
      {"blank before the client's own name", {{"client", "News, Mail"}}, sampledIn, blankClient},
      {"client unknown", {{"client", "Mail"}}, noSectionMatches, noClient},
      {"empty client list, empty client", {{"client", ""}}, sampledIn, emptyClient},
      {"empty client list, a client", {{"client", ""}}, noSectionMatches},
      {"an empty fragment fits any service", {{"service", "pop,"}}, sampledIn},
      {"client of a wrong type", {{"client", Array{"Mail"}}}, noSectionMatches},
      {"fragment of the service", {{"service", "x,IMAP"}}, sampledIn},
      {"fragment too long", {{"service", "imap.service2"}}, noSectionMatches},
      {"empty fragment, service unknown", {{"service", ""}}, noSectionMatches, noService},
      {"client fits, service does not", {{"client", "Mail"}, {"service", "pop"}}, noSectionMatches},
      {"version equal", {{"enabledSince", "2.1.5"}}, sampledIn},
      {"last part of the version too high",
       {{"enabledSince", "2.1.6"}},
       versionTooLow,
       {},
       "client section 0 is enabled since version 2.1.6."},
      {"eight bits each", {{"enabledSince", "258"}}, sampledIn},
      {"version of a wrong type", {{"enabledSince", Array{"1"}}}, versionTooLow},
  });
}

TEST(ReportingDecision, ConsentCountryDeviceAndFilters) {
  const Array two{"FR", "AT"};
  const std::string list = Value(two).description();
  check({
      {"consent missing", {}, consentMissing, noConsent},
      {"missing, nearly overridden", {{"override_dnu", 1.5}}, consentMissing, noConsent},
      {"missing, another value", {{"override_dnu", 3}}, consentMissing, noConsent, "reporting disabled by DNU: 3."},
      {"missing, overridden", {{"override_dnu", 1}}, sampledIn, noConsent},
      {"missing, override of a wrong type", {{"override_dnu", "1"}}, consentMissing, noConsent},
      {"country fragment without case", {{"locale_whitelist", Array{"x", "d"}}}, sampledIn},
      {"country not listed",
       {{"locale_whitelist", two}},
       countryNotListed,
       {},
       "(DE) isn't in country code list " + list},
      {"no country list", {{"locale_whitelist", nullptr}}, countryNotListed},
      {"neither",
       {{"locale_whitelist", nullptr}},
       countryNotListed,
       noCountry,
       "((null)) isn't in country code list (null)"},
      {"country unknown", {{"locale_whitelist", Array{"FR"}}}, sampledIn, noCountry},
      {"country unknown, empty list", {{"locale_whitelist", Array{}}}, countryNotListed, noCountry},
      {"family listed", {{"device_whitelist", Array{"arv"}}}, sampledIn},
      {"family not listed",
       {{"device_whitelist", two}},
       familyNotListed,
       {},
       "(Parva) isn't in device whitelist " + list},
      {"model blacklisted", {{"device_blacklist", Array{"abc"}}}, modelBlacklisted},
      {"model not blacklisted", {{"device_blacklist", Array{"abd"}}}, sampledIn},
      {"model unknown",
       {{"device_blacklist", two}},
       modelBlacklisted,
       noModel,
       "((null)) is in device blacklist " + list},
      {"model unknown, empty blacklist", {{"device_blacklist", Array{}}}, sampledIn, noModel},
      {"no filters", {{"filters", nullptr}}, filtersMissing, {}, "filters are required."},
      {"empty filters", {{"filters", Array{}}}, sampledIn},
      // Which test comes before which.
      {"consent, country", {{"locale_whitelist", Array{}}}, consentMissing, noConsent},
      {"country, family", {{"locale_whitelist", Array{}}, {"device_whitelist", Array{"Magna"}}}, countryNotListed},
      {"family, model", {{"device_whitelist", Array{"x"}}, {"device_blacklist", Array{"abc"}}}, familyNotListed},
      {"filters, sampling", {{"filters", nullptr}, {"sampling_threshold", nullptr}}, filtersMissing},
      {"model, filters", {{"device_blacklist", Array{"abc"}}, {"filters", nullptr}}, modelBlacklisted},
  });
  const auto typeOf = [](const Dictionary& more, const Change& change) {
    return decide({open(more)}, change).settings.dnuType;
  };
  EXPECT_EQ(typeOf({{"override_dnu", 1}}, {}), 2);
  EXPECT_EQ(typeOf({{"override_dnu", 1}, {"locale_whitelist", Array{"FR"}}}, noConsent), 1);
  EXPECT_EQ(typeOf({}, {}), 0);
}

TEST(ReportingDecision, Sampling) {
  const Array byCountry{Dictionary{{"country", Array{"FR"}}, {"threshold", 0}},
                        Dictionary{{"country", Array{"DE", "AT"}}, {"threshold", 0.5}},
                        Dictionary{{"country", Array{"DE"}}, {"threshold", 0}}};
  const Dictionary perCountry{{"per_country_sampling_thresholds", byCountry}};
  const Dictionary noCountrysThreshold{
      {"per_country_sampling_thresholds", Array{Dictionary{{"country", Array{"DE"}}}}}};
  const Dictionary noThresholdsCountry{{"per_country_sampling_thresholds", Array{Dictionary{{"threshold", 0}}}}};
  const Change smallLetters = [](auto& facts) {
    facts.samplingFactor = 0.4;
    facts.countryCode = "de";
  };
  const Change nowhere = [](auto& facts) {
    facts.samplingFactor = 0.4;
    facts.countryCode.reset();
  };
  check({
      {"no threshold", {{"sampling_threshold", nullptr}}, noSamplingThreshold, {}, "there is no sampling threshold."},
      {"above",
       {},
       heldBySampling,
       draw(0.5),
       "sampling factor 0.500000 is above the threshold 0.250000; events are held."},
      {"NaN", {{"sampling_threshold", std::numeric_limits<double>::quiet_NaN()}}, noSamplingThreshold},
      {"exactly", {}, sampledIn, draw(0.25)},
      {"just above", {}, heldBySampling, draw(std::nextafter(0.25, 1.0))},
      {"within the override", {{"override_sampling", 0.4}}, heldBySampling, draw(0.3)},
      {"exactly the override", {{"override_sampling", 0.3}}, heldBySampling, draw(0.3)},
      {"above the override",
       {{"override_sampling", 0.2}},
       disabledBySampling,
       draw(0.3),
       "sampling factor 0.300000 is above the thresholds 0.250000 and 0.200000."},
      {"threshold 0, draw 0", {{"sampling_threshold", 0}}, sampledIn, draw(0)},
      {"the first entry for the country", perCountry, sampledIn, draw(0.4)},
      {"country codes are exact", perCountry, heldBySampling, smallLetters},
      {"country unknown", perCountry, heldBySampling, nowhere},
      {"a country without a threshold", noCountrysThreshold, noSamplingThreshold},
      {"an entry for no country", noThresholdsCountry, sampledIn},
  });
}

TEST(ReportingDecision, MalformedSectionsReportNothing) {
  const std::pair<const char*, Value> rows[] = {
      {"locale_whitelist", "DE"},
      {"locale_whitelist", Array{Value(Array{})}},
      {"device_blacklist", "abd"},
      {"device_blacklist", Array{nullptr}},
      {"filters", "remove everything"},
      {"filters", Array{Dictionary{{"key", 7}}}},
      {"filters", Array{Dictionary{{"key", "a"}, {"method", Array{}}}}},
      {"filters", Array{Dictionary{{"key", "a"}, {"status", Dictionary{}}}}},
      {"filters", Array{Dictionary{{"key", "a"}}, nullptr}},
      {"sampling_threshold", Array{1}},
      {"override_sampling", Dictionary{}},
      {"per_country_sampling_thresholds", 0.5},
      {"per_country_sampling_thresholds", Array{Dictionary{{"country", "DE"}}}},
      {"per_country_sampling_thresholds", Array{Dictionary{{"threshold", Array{}}}}},
      {"event_whitelist", 3},
      {"event_blacklist", Array{Value(Array{})}},
  };
  for (const auto& [key, value] : rows) {
    const auto decision = decide({open({{key, value}})});
    check(key, decision, malformedSection);
    EXPECT_EQ(decision.reason.subject, key);
  }
}

TEST(ReportingDecision, Expedite) {
  const struct {
    Array clients;
    std::optional<bool> batches;
    Change change = {};
  } rows[] = {
      {{open({{"expedite", 1}})}, false},
      {{open({{"expedite", 0}})}, true},
      {{open({{"expedite", Array{}}})}, std::nullopt},
      {{open(), open({{"expedite", 1}})}, std::nullopt},  // the first match decides
      {{open({{"client", "x"}, {"expedite", 1}}), open({{"expedite", 0}})}, true},
      // It is taken by sections too new for this version, by refused ones, and before user info is there.
      {{open({{"enabledSince", "9"}, {"expedite", 1}})}, false},
      {{open({{"expedite", 1}})}, false, noConsent},
      {{open({{"expedite", 1}})}, false, noUserInfo},
      {{open({{"expedite", 1}})}, false, notRequired},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(decide(row.clients, row.change).settings.batchEvents, row.batches) << Value(row.clients).description();
  }
}

TEST(ReportingDecision, SettingsOfAChosenSection) {
  const Dictionary section =
      open({{"event_threshold", "12"},
            {"extras_on_internal", 2.9},
            {"custom_clientId", ""},
            {"override_sampling", 0.7},
            {"per_country_sampling_thresholds", Array{Dictionary{{"country", Array{"DE"}}, {"threshold", 0.5}}}},
            {"event_whitelist", Array{3, "12"}},
            {"event_blacklist", Array{}}});
  const auto decision = decide({section}, draw(0.9));
  EXPECT_EQ(decision.state, 1) << "sampled out, and yet everything is taken";
  const auto& settings = decision.settings;
  EXPECT_EQ(settings.sampling->threshold, 0.5);
  EXPECT_EQ(settings.overrideSampling->value, 0.7);
  EXPECT_EQ(settings.counters->eventThreshold, 12);
  EXPECT_EQ(settings.counters->extrasOnInternal, 2);
  EXPECT_TRUE(settings.customClientID);
  EXPECT_EQ(settings.linkSections.size(), 1U);
  EXPECT_EQ(settings.eventWhitelist->categories, (std::vector<std::int32_t>{3, 12}));
  EXPECT_TRUE(settings.eventBlacklist->categories.empty());
  EXPECT_FALSE(decide({open({{"filters", Array{}}})}).settings.filters) << "an empty list keeps the earlier filters";

  const auto refused = decide({section}, [](auto& facts) { facts.countryCode = "FR"; }).settings;
  EXPECT_EQ(refused.dnuType, 0);
  EXPECT_TRUE(refused.linkSections.empty());
  EXPECT_FALSE(refused.filters || refused.sampling || refused.counters || refused.eventBlacklist ||
               refused.customClientID);
}

}  // namespace
}  // namespace orvanta
