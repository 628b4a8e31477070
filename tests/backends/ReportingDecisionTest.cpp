#include "backends/ReportingDecision.h"

#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <limits>

namespace orvanta {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using Why = ReportingTest;

const Array kFilters{Value(Dictionary{{"key", "userName"}, {"action", "remove"}})};

// A section that refuses nothing by itself.
Dictionary open(Dictionary more = {}) {
  Dictionary section{{"locale_whitelist", Array{"DE"}}, {"filters", kFilters}, {"sampling_threshold", 0.25}};
  section.merge(more);
  return section;
}

Dictionary without(Dictionary section, std::string_view key) {
  section.erase(key);
  return section;
}

Array list(std::initializer_list<Dictionary> sections) {
  Array all;
  for (const auto& section : sections) all.emplace_back(section);
  return all;
}

// The session of Mail's imap service, user info and consent given, on a device whose draw is 0.2.
ReportingFacts facts() {
  ReportingFacts facts;
  facts.clientName = "Mail";
  facts.serviceName = "imap.service";
  facts.requireUserInfo = true;
  facts.hasUserInfo = true;
  facts.ownVersion = {2, 1, 5};
  facts.consent = true;
  facts.countryCode = "DE";
  facts.productFamily = "Parva";
  facts.productModel = "xABCy";
  facts.samplingFactor = 0.2;
  return facts;
}

struct Row {
  const char* what;
  Array clients;
  std::int32_t state;
  Why test;
  std::function<void(ReportingFacts&)> change;
};

void check(const std::vector<Row>& rows) {
  for (const auto& row : rows) {
    ReportingFacts given = facts();
    if (row.change) row.change(given);
    const ReportingDecision decision = evaluate({{"clients", row.clients}}, given);
    EXPECT_EQ(decision.state, row.state) << row.what << ": " << describe(decision.reason);
    EXPECT_EQ(decision.reason.test, row.test) << row.what << ": " << describe(decision.reason);
    EXPECT_FALSE(describe(decision.reason).empty()) << row.what;
  }
}

const auto noClient = [](ReportingFacts& f) { f.clientName.reset(); };
const auto noService = [](ReportingFacts& f) { f.serviceName.reset(); };
const auto noConsent = [](ReportingFacts& f) { f.consent = false; };
const auto noCountry = [](ReportingFacts& f) { f.countryCode.reset(); };
const auto noModel = [](ReportingFacts& f) { f.productModel.reset(); };

std::function<void(ReportingFacts&)> draw(double factor) {
  return [factor](ReportingFacts& f) { f.samplingFactor = factor; };
}

TEST(ReportingDecision, BeforeASection) {
  check({
      {"no sections", {}, 1, Why::noSectionMatches, {}},
      {"user info not required", {}, 2, Why::userInfoNotRequired, [](auto& f) { f.requireUserInfo = false; }},
      {"user info not required, no consent, no match", list({{{"client", "Other"}}}), 2, Why::userInfoNotRequired,
       [](auto& f) {
         f.requireUserInfo = false;
         f.consent = false;
       }},
      {"user info missing", list({open()}), 0, Why::waitingForUserInfo, [](auto& f) { f.hasUserInfo = false; }},
      {"elements that are no sections", {"text", 5}, 1, Why::noSectionMatches, {}},
      {"an element that is no section, then one", {"text", Value(open())}, 2, Why::sampledIn, {}},
  });
  for (const Dictionary& profile : {Dictionary{}, Dictionary{{"clients", "Mail"}}}) {
    const ReportingDecision decision = evaluate(profile, facts());
    EXPECT_EQ(decision.state, 1);
    EXPECT_EQ(decision.reason.test, Why::noClientList);
  }
}

TEST(ReportingDecision, SectionForTheClient) {
  check({
      {"any client", list({open()}), 2, Why::sampledIn, {}},
      {"any client, client unknown", list({open()}), 2, Why::sampledIn, noClient},
      {"client without case", list({open({{"client", "News,mAIL"}})}), 2, Why::sampledIn, {}},
      {"client as a whole", list({open({{"client", "Mai"}})}), 1, Why::noSectionMatches, {}},
      {"blank before the name", list({open({{"client", "News, Mail"}})}), 1, Why::noSectionMatches, {}},
      {"blank before the client's own name", list({open({{"client", "News, Mail"}})}), 2, Why::sampledIn,
       [](auto& f) { f.clientName = " mail"; }},
      {"client unknown", list({open({{"client", "Mail"}})}), 1, Why::noSectionMatches, noClient},
      {"empty client list", list({open({{"client", ""}})}), 1, Why::noSectionMatches, {}},
      {"empty client list, empty client", list({open({{"client", ""}})}), 2, Why::sampledIn,
       [](auto& f) { f.clientName = ""; }},
      {"empty client list, client unknown", list({open({{"client", ""}})}), 1, Why::noSectionMatches, noClient},
      {"client of a wrong type", list({open({{"client", Array{"Mail"}}})}), 1, Why::noSectionMatches, {}},
      {"fragment of the service", list({open({{"service", "x,IMAP"}})}), 2, Why::sampledIn, {}},
      {"fragment too long", list({open({{"service", "imap.service2"}})}), 1, Why::noSectionMatches, {}},
      {"blank in the fragment", list({open({{"service", "x, imap"}})}), 1, Why::noSectionMatches, {}},
      {"service unknown", list({open({{"service", "imap"}})}), 1, Why::noSectionMatches, noService},
      {"any service, service unknown", list({open()}), 2, Why::sampledIn, noService},
      {"empty fragment, service unknown", list({open({{"service", ""}})}), 1, Why::noSectionMatches, noService},
      {"service of a wrong type", list({open({{"service", 1}})}), 1, Why::noSectionMatches, {}},
      {"client fits, service does not",
       list({open({{"client", "Mail"}, {"service", "pop"}})}),
       1,
       Why::noSectionMatches,
       {}},
      {"the first that matches decides",
       list({open({{"client", "News"}}), open({{"sampling_threshold", 0.1}}), open()}),
       3,
       Why::held,
       {}},
  });
}

TEST(ReportingDecision, VersionGate) {
  check({
      {"equal", list({open({{"enabledSince", "2.1.5"}})}), 2, Why::sampledIn, {}},
      {"lower", list({open({{"enabledSince", "2.0.9"}})}), 2, Why::sampledIn, {}},
      {"two parts", list({open({{"enabledSince", "2.1"}})}), 2, Why::sampledIn, {}},
      {"a number", list({open({{"enabledSince", 2.1}})}), 2, Why::sampledIn, {}},
      {"last part too high", list({open({{"enabledSince", "2.1.6"}})}), 1, Why::versionTooLow, {}},
      {"middle part decides", list({open({{"enabledSince", "2.2.0"}})}), 1, Why::versionTooLow, {}},
      {"first part decides", list({open({{"enabledSince", "3"}})}), 1, Why::versionTooLow, {}},
      {"eight bits each", list({open({{"enabledSince", "258"}})}), 2, Why::sampledIn, {}},
      {"a wrong type", list({open({{"enabledSince", Array{"1"}}})}), 1, Why::versionTooLow, {}},
      {"the next section", list({open({{"enabledSince", "3"}}), open()}), 2, Why::sampledIn, {}},
  });
  const auto decision = evaluate({{"clients", list({{{"client", "x"}}, open({{"enabledSince", "3.1"}})})}}, facts());
  EXPECT_EQ(decision.reason.section, 1U);
  EXPECT_EQ(decision.reason.subject, "3.1");
  const auto later = evaluate({{"clients", list({open({{"enabledSince", "3"}}), open()})}}, facts());
  EXPECT_EQ(later.reason.section, 1U);
}

TEST(ReportingDecision, Consent) {
  check({
      {"given", list({open({{"override_dnu", 0}})}), 2, Why::sampledIn, {}},
      {"missing", list({open()}), 1, Why::consentMissing, noConsent},
      {"missing, override 0", list({open({{"override_dnu", 0}})}), 1, Why::consentMissing, noConsent},
      {"missing, override 2", list({open({{"override_dnu", 2}})}), 1, Why::consentMissing, noConsent},
      {"missing, overridden", list({open({{"override_dnu", 1}})}), 2, Why::sampledIn, noConsent},
      {"missing, overridden by true", list({open({{"override_dnu", true}})}), 2, Why::sampledIn, noConsent},
      {"missing, override of a wrong type", list({open({{"override_dnu", "1"}})}), 1, Why::consentMissing, noConsent},
  });
  const auto type = [](Dictionary section, bool consent) {
    ReportingFacts given = facts();
    given.consent = consent;
    return evaluate({{"clients", list({open(std::move(section))})}}, given).settings.dnuType;
  };
  EXPECT_EQ(type({{"override_dnu", 1}}, true), 2);
  EXPECT_EQ(type({{"override_dnu", 1}}, false), 1);
  EXPECT_EQ(type({{"override_dnu", 1}, {"locale_whitelist", Array{"FR"}}}, false), 1);
  EXPECT_EQ(type({}, true), 0);
  EXPECT_EQ(type({}, false), 0);
}

TEST(ReportingDecision, CountryAndDevice) {
  check({
      {"country fragment without case", list({open({{"locale_whitelist", Array{"x", "d"}}})}), 2, Why::sampledIn, {}},
      {"country not listed", list({open({{"locale_whitelist", Array{"FR"}}})}), 1, Why::countryNotListed, {}},
      {"no country list", list({without(open(), "locale_whitelist")}), 1, Why::countryNotListed, {}},
      {"empty country list", list({open({{"locale_whitelist", Array{}}})}), 1, Why::countryNotListed, {}},
      {"country unknown", list({open({{"locale_whitelist", Array{"FR"}}})}), 2, Why::sampledIn, noCountry},
      {"country unknown, empty list", list({open({{"locale_whitelist", Array{}}})}), 1, Why::countryNotListed,
       noCountry},
      {"family listed", list({open({{"device_whitelist", Array{"arv"}}})}), 2, Why::sampledIn, {}},
      {"family not listed", list({open({{"device_whitelist", Array{"Magna"}}})}), 1, Why::familyNotListed, {}},
      {"empty family list", list({open({{"device_whitelist", Array{}}})}), 2, Why::sampledIn, {}},
      {"model blacklisted", list({open({{"device_blacklist", Array{"abc"}}})}), 1, Why::modelBlacklisted, {}},
      {"model not blacklisted", list({open({{"device_blacklist", Array{"abd"}}})}), 2, Why::sampledIn, {}},
      {"empty blacklist", list({open({{"device_blacklist", Array{}}})}), 2, Why::sampledIn, {}},
      {"model unknown", list({open({{"device_blacklist", Array{"abd"}}})}), 1, Why::modelBlacklisted, noModel},
      {"model unknown, empty blacklist", list({open({{"device_blacklist", Array{}}})}), 2, Why::sampledIn, noModel},
      {"model unknown, no blacklist", list({open()}), 2, Why::sampledIn, noModel},
      {"no filters", list({without(open(), "filters")}), 1, Why::filtersMissing, {}},
      {"empty filters", list({open({{"filters", Array{}}})}), 2, Why::sampledIn, {}},
      {"consent is asked before the country", list({open({{"locale_whitelist", Array{}}})}), 1, Why::consentMissing,
       noConsent},
      {"the country before the family",
       list({open({{"locale_whitelist", Array{}}, {"device_whitelist", Array{"Magna"}}})}),
       1,
       Why::countryNotListed,
       {}},
      {"the family before the model",
       list({open({{"device_whitelist", Array{"Magna"}}, {"device_blacklist", Array{"abc"}}})}),
       1,
       Why::familyNotListed,
       {}},
      {"the model before the filters",
       list({without(open({{"device_blacklist", Array{"abc"}}}), "filters")}),
       1,
       Why::modelBlacklisted,
       {}},
  });
}

TEST(ReportingDecision, Sampling) {
  const Dictionary country{{"country", Array{"DE", "AT"}}, {"threshold", 0.5}};
  const Array byCountry{Value(Dictionary{{"country", Array{"FR"}}, {"threshold", 0}}), Value(country),
                        Value(Dictionary{{"country", Array{"DE"}}, {"threshold", 0}})};
  check({
      {"no threshold", list({without(open(), "sampling_threshold")}), 1, Why::noSamplingThreshold, {}},
      {"NaN",
       list({open({{"sampling_threshold", std::numeric_limits<double>::quiet_NaN()}})}),
       1,
       Why::noSamplingThreshold,
       {}},
      {"below", list({open()}), 2, Why::sampledIn, draw(0.2)},
      {"exactly", list({open()}), 2, Why::sampledIn, draw(0.25)},
      {"just above", list({open()}), 3, Why::held, draw(std::nextafter(0.25, 1.0))},
      {"above, no override", list({open()}), 3, Why::held, draw(0.3)},
      {"within the override", list({open({{"override_sampling", 0.4}})}), 3, Why::held, draw(0.3)},
      {"exactly the override", list({open({{"override_sampling", 0.3}})}), 3, Why::held, draw(0.3)},
      {"above the override", list({open({{"override_sampling", 0.2}})}), 1, Why::sampledOut, draw(0.3)},
      {"threshold 0, draw 0", list({open({{"sampling_threshold", 0}})}), 2, Why::sampledIn, draw(0)},
      {"threshold as text", list({open({{"sampling_threshold", "0.25"}})}), 2, Why::sampledIn, {}},
      {"the first entry for the country", list({open({{"per_country_sampling_thresholds", byCountry}})}), 2,
       Why::sampledIn, draw(0.4)},
      {"country codes are exact", list({open({{"per_country_sampling_thresholds", byCountry}})}), 3, Why::held,
       [](auto& f) {
         f.samplingFactor = 0.4;
         f.countryCode = "de";
       }},
      {"country unknown", list({open({{"per_country_sampling_thresholds", byCountry}})}), 3, Why::held,
       [](auto& f) {
         f.samplingFactor = 0.4;
         f.countryCode.reset();
       }},
      {"a country without a threshold",
       list({open({{"per_country_sampling_thresholds", Array{Value(Dictionary{{"country", Array{"DE"}}})}}})}),
       1,
       Why::noSamplingThreshold,
       {}},
      {"an entry for no country",
       list({open({{"per_country_sampling_thresholds", Array{Value(Dictionary{{"threshold", 0}})}}})}),
       2,
       Why::sampledIn,
       {}},
  });
}

TEST(ReportingDecision, MalformedSectionsReportNothing) {
  const std::pair<const char*, Value> rows[] = {
      {"locale_whitelist", "DE"},
      {"locale_whitelist", Array{Value(Array{})}},
      {"device_whitelist", "Parva"},
      {"device_blacklist", "abd"},
      {"device_blacklist", Array{nullptr}},
      {"filters", "remove everything"},
      {"filters", Array{"userName"}},
      {"filters", Array{Value(Dictionary{{"key", 7}})}},
      {"sampling_threshold", Array{1}},
      {"override_sampling", Dictionary{}},
      {"per_country_sampling_thresholds", 0.5},
      {"per_country_sampling_thresholds", Array{0.5}},
      {"per_country_sampling_thresholds", Array{Value(Dictionary{{"country", "DE"}})}},
      {"per_country_sampling_thresholds", Array{Value(Dictionary{{"threshold", Array{}}})}},
      {"event_whitelist", 3},
      {"event_blacklist", Array{Value(Array{})}},
  };
  for (const auto& [key, value] : rows) {
    const ReportingDecision decision = evaluate({{"clients", list({open({{key, value}})})}}, facts());
    EXPECT_EQ(decision.state, 1) << key;
    EXPECT_EQ(decision.reason.test, Why::malformedSection) << key << ": " << describe(decision.reason);
    EXPECT_EQ(decision.reason.subject, key);
    EXPECT_NE(describe(decision.reason).find(key), std::string::npos);
  }
}

TEST(ReportingDecision, ReasonsCarryTheirOperands) {
  const auto reasonOf = [](Dictionary section, const std::function<void(ReportingFacts&)>& change) {
    ReportingFacts given = facts();
    if (change) change(given);
    return describe(evaluate({{"clients", list({{{"client", "x"}}, std::move(section)})}}, given).reason);
  };
  const std::string list = Value(Array{"FR", "AT"}).description();
  EXPECT_EQ(reasonOf(open({{"locale_whitelist", Array{"FR", "AT"}}}), {}), "(DE) isn't in country code list " + list);
  EXPECT_EQ(reasonOf(without(open(), "locale_whitelist"), noCountry), "((null)) isn't in country code list (null)");
  EXPECT_EQ(reasonOf(open({{"device_whitelist", Array{"FR", "AT"}}}), {}), "(Parva) isn't in device whitelist " + list);
  EXPECT_EQ(reasonOf(open({{"device_blacklist", Array{"FR", "AT"}}}), noModel),
            "((null)) is in device blacklist " + list);
  EXPECT_EQ(reasonOf(open({{"override_dnu", 3}}), noConsent), "reporting disabled by DNU: 3.");
  EXPECT_EQ(reasonOf(without(open(), "filters"), {}), "filters are required.");
  EXPECT_EQ(reasonOf(open({{"override_sampling", 0.3}}), draw(0.5)),
            "sampling factor 0.500000 is above the thresholds 0.250000 and 0.300000.");
  EXPECT_EQ(reasonOf(open({{"enabledSince", "9.9"}}), {}), "client section 1 is enabled since version 9.9.");
  EXPECT_EQ(reasonOf(open({{"device_whitelist", 5}}), {}),
            "client section 1 is malformed: \"device_whitelist\" is no list.");
}

TEST(ReportingDecision, Expedite) {
  const auto batch = [](Array clients, const std::function<void(ReportingFacts&)>& change = {}) {
    ReportingFacts given = facts();
    if (change) change(given);
    return evaluate({{"clients", std::move(clients)}}, given).settings.batchEvents;
  };
  EXPECT_EQ(batch(list({open({{"expedite", 1}})})), false);
  EXPECT_EQ(batch(list({open({{"expedite", 0}})})), true);
  EXPECT_EQ(batch(list({open({{"expedite", "0"}})})), true);
  EXPECT_EQ(batch(list({open({{"expedite", Array{}}})})), std::nullopt);
  EXPECT_EQ(batch(list({open(), open({{"expedite", 1}})})), std::nullopt) << "the first match decides";
  EXPECT_EQ(batch(list({open({{"client", "x"}, {"expedite", 1}}), open({{"expedite", 0}})})), true);
  // It is taken by sections too new for this version, by refused ones, and before user info is there.
  EXPECT_EQ(batch(list({open({{"enabledSince", "9"}, {"expedite", 1}})})), false);
  EXPECT_EQ(batch(list({open({{"expedite", 1}})}), noConsent), false);
  EXPECT_EQ(batch(list({open({{"expedite", 1}})}), [](auto& f) { f.hasUserInfo = false; }), false);
  EXPECT_EQ(batch(list({open({{"expedite", 1}})}), [](auto& f) { f.requireUserInfo = false; }), false);
}

TEST(ReportingDecision, SettingsWithoutRequiredUserInfo) {
  ReportingFacts given = facts();
  given.requireUserInfo = false;
  const Array clients = list({{{"realtime_post_url", "r0"}},
                              {{"post_url", "p1"}, {"event_threshold", 7}, {"extras_on_internal", 1}},
                              {{"post_url", "p2"}}});
  const Dictionary profile{{"clients", clients}};
  const auto first = evaluate(profile, given).settings;
  EXPECT_EQ(first.linkSections.size(), 2U);
  EXPECT_EQ(first.counters->eventThreshold, 7);
  EXPECT_EQ(first.counters->extrasOnInternal, 1);
  EXPECT_FALSE(first.dnuType || first.filters || first.sampling || first.eventWhitelist);

  given.postURLFixed = true;
  const auto fixed = evaluate(profile, given).settings;
  EXPECT_EQ(fixed.linkSections.size(), 3U);
  EXPECT_EQ(fixed.counters->eventThreshold, 0);
}

TEST(ReportingDecision, SettingsOfARefusedSection) {
  ReportingFacts given = facts();
  given.countryCode = "FR";
  const auto settings =
      evaluate({{"clients", list({open({{"post_url", "p"}, {"event_blacklist", Array{1}}})})}}, given).settings;
  EXPECT_EQ(settings.dnuType, 0);
  EXPECT_TRUE(settings.linkSections.empty());
  EXPECT_FALSE(settings.filters || settings.sampling || settings.counters || settings.eventBlacklist ||
               settings.customClientID);
}

TEST(ReportingDecision, SettingsOfAChosenSection) {
  ReportingFacts given = facts();
  given.samplingFactor = 0.9;
  const Array byCountry{Value(Dictionary{{"country", Array{"DE"}}, {"threshold", 0.5}})};
  const Dictionary section = open({{"event_threshold", "12"},
                                   {"extras_on_internal", 2.9},
                                   {"custom_clientId", ""},
                                   {"override_sampling", 0.7},
                                   {"per_country_sampling_thresholds", byCountry},
                                   {"event_whitelist", Array{3, "12"}},
                                   {"event_blacklist", Array{}}});
  const auto decision = evaluate({{"clients", list({section})}}, given);
  // Sampled out, and yet everything is taken.
  EXPECT_EQ(decision.state, 1);
  const auto& settings = decision.settings;
  EXPECT_EQ(settings.filters->table().size(), 1U);
  EXPECT_EQ(settings.sampling->threshold, 0.5);
  EXPECT_EQ(settings.sampling->changedByCountry->from, 0.25);
  EXPECT_EQ(settings.sampling->changedByCountry->to, 0.5);
  EXPECT_EQ(settings.overrideSampling->value, 0.7);
  EXPECT_EQ(settings.counters->eventThreshold, 12);
  EXPECT_EQ(settings.counters->extrasOnInternal, 2);
  EXPECT_TRUE(settings.customClientID);
  EXPECT_EQ(settings.linkSections.size(), 1U);
  EXPECT_EQ(settings.eventWhitelist->categories, (std::vector<std::int32_t>{3, 12}));
  EXPECT_TRUE(settings.eventBlacklist->categories.empty());

  given.samplingFactor = 0.1;
  EXPECT_FALSE(evaluate({{"clients", list({section})}}, given).settings.overrideSampling) << "left as it was";
  EXPECT_FALSE(evaluate({{"clients", list({open({{"filters", Array{}}})})}}, given).settings.filters)
      << "an empty list keeps the earlier filters";
}

}  // namespace
}  // namespace orvanta
