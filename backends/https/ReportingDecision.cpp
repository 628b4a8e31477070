#include "backends/https/ReportingDecision.h"

#include <algorithm>
#include <cmath>

#include "backends/https/ClientSection.h"
#include "backends/https/PostURLs.h"
#include "backends/https/StringMatching.h"

namespace orvanta {
namespace {

bool isForClient(const Dictionary& section, const ReportingFacts& facts) {
  return matchClientNameAndServiceID(section, facts.clientName, facts.serviceName);
}

// Decides by the first section for the client whether events are batched, against what the session asked for.
void takeExpedite(ReportingDecision& decision, const Array& sections, const ReportingFacts& facts) {
  for (const Value& element : sections) {
    const Dictionary* section = element.dictionary();
    if (section == nullptr || !isForClient(*section, facts)) continue;
    if (const auto expedite = realUnder(*section, StorebagKey::expedite))
      decision.settings.batchEvents = *expedite == 0;
    return;
  }
}

void takeCounters(ReportingDecision& decision, const Dictionary* section) {
  ReportingSettings::Counters counters;
  if (section != nullptr) {
    counters.eventThreshold = intUnder(*section, StorebagKey::eventThreshold).value_or(0);
    counters.extrasOnInternal = intUnder(*section, StorebagKey::extrasOnInternal).value_or(0);
  }
  decision.settings.counters = counters;
}

void reportWithoutUserInfo(ReportingDecision& decision, const Array& sections, const ReportingFacts& facts) {
  const Dictionary* source = nullptr;
  for (const Value& element : sections) {
    const Dictionary* section = element.dictionary();
    if (section == nullptr) continue;
    decision.settings.linkSections.push_back(section);
    if (suppliedPostURL(*section, facts.postURLFixed) == nullptr) continue;
    source = section;
    break;
  }
  takeCounters(decision, source);
  decision.state = kBackendEnabled;
  decision.reason.test = ReportingTest::userInfoNotRequired;
}

// The first section for the client that is enabled for this version; null, with the reason, when no section is.
const Dictionary* chooseSection(ReportingReason& reason, const Array& sections, const ReportingFacts& facts) {
  reason.test = ReportingTest::noSectionMatches;
  for (std::size_t i = 0; i < sections.size(); ++i) {
    const Dictionary* section = sections[i].dictionary();
    if (section == nullptr || !isForClient(*section, facts)) continue;
    if (isFrameworkEnabledForClient(*section, facts.ownVersion)) {
      reason.section = i;
      reason.subject.reset();
      return section;
    }
    if (reason.section) continue;
    reason.test = ReportingTest::versionTooLow;
    reason.section = i;
    reason.subject = valueUnder(*section, StorebagKey::enabledSince)->description();
  }
  return nullptr;
}

// A list test that refuses says so with the text and the list that it looked at.
bool refuseByList(ReportingReason& reason, ReportingTest test, const Dictionary& section, StorebagKey key,
                  const std::optional<std::string>& text) {
  reason.test = test;
  reason.subject = text;
  if (const Value* list = valueUnder(section, key)) reason.list = list->description();
  return false;
}

// Returns what is wrong with the section's filters. Without any they stay nullopt.
std::optional<MalformedKey> buildFilters(const Dictionary& section, std::optional<EventFilters>& filters) {
  const Value* list = valueUnder(section, StorebagKey::filters);
  if (list == nullptr) return std::nullopt;
  const std::string key(nameOf(StorebagKey::filters));
  if (list->array() == nullptr) return MalformedKey{key, "is no list"};
  auto made = EventFilters::createFiltersFromArray(*list->array());
  if (!made) return MalformedKey{key, "does not hold: " + made.error()};
  filters = std::move(*made);
  return std::nullopt;
}

// Consent, country, device and filters. False, with the reason, when one of them refuses.
bool passesTests(ReportingDecision& decision, const Dictionary& section, const ReportingFacts& facts,
                 std::optional<EventFilters> filters) {
  ReportingReason& reason = decision.reason;
  // Consent is overridden by a number alone: a value of another type overrides nothing.
  const Value* override = valueUnder(section, StorebagKey::overrideDNU);
  if (override != nullptr && override->isNumber()) reason.overrideDNU = *intUnder(section, StorebagKey::overrideDNU);
  // Compared unrounded: 1.5 is not the 1 that overrides.
  if (reason.overrideDNU == 1 && realUnder(section, StorebagKey::overrideDNU) == 1.0) {
    decision.settings.dnuType =
        facts.consentGiven ? ClientIdentity::kConsentOverriddenGiven : ClientIdentity::kConsentOverriddenNotGiven;
  } else {
    decision.settings.dnuType = ClientIdentity::kConsentRespected;
    reason.test = ReportingTest::consentMissing;
    if (!facts.consentGiven) return false;
  }
  // An unknown country passes any list that has an entry; without one no device reports.
  if (!matchStringWithList(textsUnder(section, StorebagKey::localeWhitelist), facts.countryCode, false)) {
    return refuseByList(reason, ReportingTest::countryNotListed, section, StorebagKey::localeWhitelist,
                        facts.countryCode);
  }
  if (!matchStringWithList(textsUnder(section, StorebagKey::deviceWhitelist), facts.productFamily, true)) {
    return refuseByList(reason, ReportingTest::familyNotListed, section, StorebagKey::deviceWhitelist,
                        facts.productFamily);
  }
  if (matchStringWithList(textsUnder(section, StorebagKey::deviceBlacklist), facts.productType, false)) {
    return refuseByList(reason, ReportingTest::modelBlacklisted, section, StorebagKey::deviceBlacklist,
                        facts.productType);
  }
  reason.test = ReportingTest::filtersMissing;
  if (!filters) return false;
  // An empty list keeps the filters of an earlier evaluation.
  if (!filters->empty()) decision.settings.filters = std::move(filters);
  return true;
}

void takeSampling(ReportingDecision& decision, const Dictionary& section, const ReportingFacts& facts) {
  auto& sampling = decision.settings.sampling.emplace();
  sampling.threshold = realUnder(section, StorebagKey::samplingThreshold);
  const Value* byCountry = valueUnder(section, StorebagKey::perCountrySamplingThresholds);
  if (byCountry == nullptr || !facts.countryCode) return;
  for (const Value& element : *byCountry->array()) {
    const TextList countries = textsUnder(*element.dictionary(), StorebagKey::thresholdCountry);
    if (std::find(countries.begin(), countries.end(), *facts.countryCode) == countries.end()) continue;
    const auto threshold = realUnder(*element.dictionary(), StorebagKey::threshold);
    sampling.changedByCountry =
        ReportingSettings::CountryThreshold{*facts.countryCode, sampling.threshold.value_or(0), threshold.value_or(0)};
    sampling.threshold = threshold;
    return;
  }
}

void decideBySampling(ReportingDecision& decision, const Dictionary& section, double factor) {
  ReportingReason& reason = decision.reason;
  const auto conclude = [&](BackendState state, ReportingTest test) {
    decision.state = state;
    reason.test = test;
  };
  reason.samplingFactor = factor;
  reason.threshold = decision.settings.sampling->threshold;
  if (!reason.threshold || std::isnan(*reason.threshold)) {
    return conclude(kBackendDisabled, ReportingTest::noSamplingThreshold);
  }
  if (factor <= *reason.threshold) return conclude(kBackendEnabled, ReportingTest::sampledIn);
  reason.overrideSampling = realUnder(section, StorebagKey::overrideSampling);
  decision.settings.overrideSampling.emplace().value = reason.overrideSampling;
  if (!reason.overrideSampling || factor <= *reason.overrideSampling) {
    return conclude(kBackendHeld, ReportingTest::heldBySampling);
  }
  conclude(kBackendDisabled, ReportingTest::disabledBySampling);
}

std::optional<ReportingSettings::EventList> eventList(const Dictionary& section, StorebagKey key) {
  const Value* list = valueUnder(section, key);
  if (list == nullptr) return std::nullopt;
  ReportingSettings::EventList taken;
  taken.source = list;
  for (const Value& element : *list->array()) {
    taken.categories.push_back(static_cast<std::int32_t>(element.integerValue()));
  }
  return taken;
}

}  // namespace

ReportingDecision evaluate(const Dictionary& profile, const ReportingFacts& facts) {
  ReportingDecision decision;
  const Array* sections = clientSections(profile);
  if (sections == nullptr) return decision;
  takeExpedite(decision, *sections, facts);
  if (!facts.requireUserInfo) {
    reportWithoutUserInfo(decision, *sections, facts);
    return decision;
  }
  if (!facts.hasUserInfo) {
    decision.state = kBackendWaiting;
    decision.reason.test = ReportingTest::waitingForUserInfo;
    return decision;
  }
  const Dictionary* section = chooseSection(decision.reason, *sections, facts);
  if (section == nullptr) return decision;
  std::optional<EventFilters> filters;
  auto malformed = findMalformedKey(*section);
  if (!malformed) malformed = buildFilters(*section, filters);
  if (malformed) {
    decision.reason.test = ReportingTest::malformedSection;
    decision.reason.subject = std::move(malformed->key);
    decision.reason.list = std::move(malformed->problem);
    return decision;
  }
  if (!passesTests(decision, *section, facts, std::move(filters))) return decision;
  takeSampling(decision, *section, facts);
  decideBySampling(decision, *section, facts.samplingFactor);
  takeCounters(decision, section);
  decision.settings.customClientID = valueUnder(*section, StorebagKey::customClientID) != nullptr;
  decision.settings.linkSections.push_back(section);
  decision.settings.eventWhitelist = eventList(*section, StorebagKey::eventWhitelist);
  decision.settings.eventBlacklist = eventList(*section, StorebagKey::eventBlacklist);
  return decision;
}

}  // namespace orvanta
