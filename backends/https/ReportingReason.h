#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

namespace orvanta {

// The test that decided an evaluation.
enum class ReportingTest {
  // Before a section is chosen.
  noClientList,         // the profile lists no client sections
  userInfoNotRequired,  // enabled without further tests
  waitingForUserInfo,   // the session requires user info and has none yet
  noSectionMatches,     // no section is for this client and service
  versionTooLow,        // sections for this client and service, each for newer versions
  // In the section that was chosen.
  malformedSection,  // a key has an invalid value
  consentMissing,
  countryNotListed,
  familyNotListed,
  modelBlacklisted,
  filtersMissing,
  noSamplingThreshold,
  sampledIn,           // enabled
  heldBySampling,      // above the threshold, within the wider share
  disabledBySampling,  // above both
};

// Why an evaluation came out as it did: the test and what it looked at. A value, from which log lines, tests and tools
// for storebag authors all print.
struct ReportingReason {
  ReportingTest test = ReportingTest::noClientList;
  std::optional<std::size_t> section;  // index in "clients": the one chosen, or the first that was too new
  std::optional<std::string> subject;  // country code, family, model; the malformed key; the version that is required
  std::optional<std::string> list;     // description of the list that was searched; what is wrong with a malformed key
  std::int32_t overrideDNU = 0;
  double samplingFactor = 0;
  std::optional<double> threshold;         // after the country's override
  std::optional<double> overrideSampling;  // the wider share
};

// One line for people.
std::string describe(const ReportingReason& reason);

}  // namespace orvanta
