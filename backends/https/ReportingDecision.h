#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "backends/OrvantaBackend.h"
#include "backends/https/ClientIdentity.h"
#include "backends/https/EventFilters.h"
#include "backends/https/ReportingReason.h"
#include "interface/Values.h"

namespace orvanta {

// The facts that an evaluation looks at besides the storebag.
struct ReportingFacts {
  std::optional<std::string> clientName;
  std::optional<std::string> serviceName;
  bool requireUserInfo = false;
  bool hasUserInfo = false;
  OrvantaBackend::SelfVersion ownVersion;
  bool consentGiven = false;  // the user's, to diagnostics submission
  std::optional<std::string> countryCode;
  std::string productFamily;
  std::optional<std::string> productType;
  double samplingFactor = 0;
  bool postURLFixed = false;  // by a user default, so that no section supplies it
};

// The settings that an evaluation decides, in the order in which they take effect. One that is nullopt stays as it was.
// Pointers lead into the profile.
struct ReportingSettings {
  struct CountryThreshold {
    std::string countryCode;
    double from = 0;  // 0 without a threshold; so is `to`
    double to = 0;
  };
  struct Sampling {
    std::optional<double> threshold;
    std::optional<CountryThreshold> changedByCountry;
  };
  struct OverrideSampling {
    std::optional<double> value;
  };
  struct Counters {
    std::int32_t eventThreshold = 0;
    std::int32_t extrasOnInternal = 0;
  };
  struct EventList {
    std::vector<std::int32_t> categories;
    const Value* source = nullptr;
  };

  std::optional<bool> batchEvents;
  std::optional<ClientIdentity::DnuType> dnuType;
  std::optional<EventFilters> filters;
  std::optional<Sampling> sampling;
  std::optional<OverrideSampling> overrideSampling;
  std::optional<Counters> counters;
  bool customClientID = false;
  std::vector<const Dictionary*> linkSections;  // each supplies URLs, the later over the earlier
  std::optional<EventList> eventWhitelist;
  std::optional<EventList> eventBlacklist;
};

struct ReportingDecision {
  BackendState state = kBackendDisabled;
  ReportingReason reason;
  ReportingSettings settings;
};

// Decides whether and how a backend with this profile reports. Pure: no clock, no logs, no I/O. Elements of "clients"
// that are not dictionaries are passed over; a chosen section with invalid restrictions reports nothing.
ReportingDecision evaluate(const Dictionary& profile, const ReportingFacts& facts);

}  // namespace orvanta
