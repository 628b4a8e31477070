#include "backends/https/ReportingReason.h"

#include <fmt/format.h>

namespace orvanta {
namespace {

std::string orNull(const std::optional<std::string>& text) {
  return text.value_or("(null)");
}

}  // namespace

std::string describe(const ReportingReason& reason) {
  const double factor = reason.samplingFactor;
  const double threshold = reason.threshold.value_or(0);
  switch (reason.test) {
    case ReportingTest::noClientList:
      return "there is no client list.";
    case ReportingTest::userInfoNotRequired:
      return "the session does not require user info, so that no test applies.";
    case ReportingTest::waitingForUserInfo:
      return "waiting for user info.";
    case ReportingTest::noSectionMatches:
      return "no client section matches.";
    case ReportingTest::versionTooLow:
      return fmt::format("client section {} is enabled since version {}.", reason.section.value_or(0),
                         orNull(reason.subject));
    case ReportingTest::malformedSection:
      return fmt::format("client section {} is malformed: \"{}\" {}.", reason.section.value_or(0),
                         orNull(reason.subject), orNull(reason.list));
    case ReportingTest::consentMissing:
      return fmt::format("reporting disabled by DNU: {}.", reason.overrideDNU);
    case ReportingTest::countryNotListed:
      return fmt::format("({}) isn't in country code list {}", orNull(reason.subject), orNull(reason.list));
    case ReportingTest::familyNotListed:
      return fmt::format("({}) isn't in device whitelist {}", orNull(reason.subject), orNull(reason.list));
    case ReportingTest::modelBlacklisted:
      return fmt::format("({}) is in device blacklist {}", orNull(reason.subject), orNull(reason.list));
    case ReportingTest::filtersMissing:
      return "filters are required.";
    case ReportingTest::noSamplingThreshold:
      return "there is no sampling threshold.";
    case ReportingTest::sampledIn:
      return fmt::format("sampling factor {:f} is within the threshold {:f}.", factor, threshold);
    case ReportingTest::heldBySampling:
      if (!reason.overrideSampling) {
        return fmt::format("sampling factor {:f} is above the threshold {:f}; events are held.", factor, threshold);
      }
      return fmt::format("sampling factor {:f} is above the threshold {:f} but within {:f}; events are held.", factor,
                         threshold, *reason.overrideSampling);
    case ReportingTest::disabledBySampling:
      return fmt::format("sampling factor {:f} is above the thresholds {:f} and {:f}.", factor, threshold,
                         reason.overrideSampling.value_or(0));
  }
  return {};
}

}  // namespace orvanta
