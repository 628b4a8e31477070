// HTTPSPostBackend: how it gathers the facts of an evaluation and takes its settings.

#include "backends/https/HTTPSPostBackend.h"
#include "config/DeviceInfo.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {
namespace {

const char* orNull(const std::optional<std::string>& text) {
  return text ? text->c_str() : "(null)";
}

void logRefusal(const ReportingReason& reason) {
  switch (reason.test) {
    case ReportingTest::consentMissing:
    case ReportingTest::countryNotListed:
    case ReportingTest::familyNotListed:
    case ReportingTest::modelBlacklisted:
      ORVANTA_LOG(debug, "HTTPSPostBackend(updateBackendState): {}", describe(reason));
      return;
    case ReportingTest::malformedSection:
    case ReportingTest::filtersMissing:
      ORVANTA_LOG(warning, "HTTPSPostBackend(updateBackendState): {}", describe(reason));
      return;
    default:
      return;
  }
}

}  // namespace

void HTTPSPostBackend::updateState() {
  // A frozen state is not even stored again: that would undo what a server's answer or a parent session sets meanwhile.
  if (_immutable) return;
  const ReportingFacts facts = gatherFacts();
  ReportingDecision decision = evaluate(*profile(), facts);
  const BackendState decided = decision.state;
  apply(std::move(decision), facts);
  setState(decided);
}

ReportingFacts HTTPSPostBackend::gatherFacts() const {
  ReportingFacts facts;
  facts.clientName = userInfoText(userInfoDict(), kOrvantaUserInfoClientName);
  facts.serviceName = userInfoText(userInfoDict(), kOrvantaUserInfoServiceName);
  facts.requireUserInfo = identity().requireUserInfo;
  facts.hasUserInfo = userInfoDict() != nullptr;
  facts.ownVersion = identity().selfVersion;
  facts.consentGiven = _consentGiven;
  facts.countryCode = platform().device().countryCode();
  facts.productFamily = identity().productFamily;
  facts.productType = identity().productType;
  facts.samplingFactor = samplingFactor();
  facts.postURLFixed = _postURLs.postURLFixed();
  return facts;
}

void HTTPSPostBackend::apply(ReportingDecision&& decision, const ReportingFacts& facts) {
  ReportingSettings& settings = decision.settings;
  if (settings.batchEvents) {
    setBatchEvents(*settings.batchEvents);
    ORVANTA_LOG(debug, "HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent={:d}", batchEvents());
  }
  if (settings.dnuType) _clientIdentity.setDnuType(*settings.dnuType);
  logRefusal(decision.reason);
  if (settings.filters) _filters = std::move(*settings.filters);
  if (settings.sampling) {
    if (const auto& change = settings.sampling->changedByCountry) {
      ORVANTA_LOG(debug,
                  "HTTPSPostBackend(updateBackendState): sampling threshold for {} changed from {:.2f} to {:.2f}",
                  change->countryCode, static_cast<float>(change->from), static_cast<float>(change->to));
    }
    setSamplingThreshold(settings.sampling->threshold);
  }
  if (settings.overrideSampling) _overrideSampling = settings.overrideSampling->value;
  // Without user info the URLs come first, with it the counters do.
  if (!facts.requireUserInfo) {
    for (const auto* section : settings.linkSections) _postURLs.update(*section);
  }
  if (settings.counters) resetBackendStateWithClient(*settings.counters);
  if (settings.customClientID) {
    _clientIdentity.setUuidCustom(
        getPersistentIdentifierForCustomClientIDSuffix(platform(), facts.clientName, facts.serviceName));
  }
  if (facts.requireUserInfo && settings.sampling) {
    ORVANTA_LOG(debug, "HTTPSPostBackend(updateBackendState): {}: client found {}:{}, state={}, samplingFactor={:f}",
                name(), orNull(facts.clientName), orNull(facts.serviceName), int{decision.state}, facts.samplingFactor);
    for (const auto* section : settings.linkSections) _postURLs.update(*section);
  }
  if (auto& list = settings.eventWhitelist) {
    ORVANTA_LOG(debug, "HTTPSPostBackend(updateBackendState): {}: eventWhitelist={}", name(),
                list->source->description());
    setEventWhitelist(std::move(list->categories));
  }
  if (auto& list = settings.eventBlacklist) {
    ORVANTA_LOG(debug, "HTTPSPostBackend(updateBackendState): {}: eventBlacklist={}", name(),
                list->source->description());
    setEventBlacklist(std::move(list->categories));
  }
  _reason = std::move(decision.reason);
}

void HTTPSPostBackend::resetBackendStateWithClient(const ReportingSettings::Counters& counters) {
  _eventThreshold = counters.eventThreshold;
  ORVANTA_LOG(debug, "resetBackendStateWithClient: event_threshold set to {}", counters.eventThreshold);
  _clientIdentity.setExtrasOnInternal(counters.extrasOnInternal);
  ORVANTA_LOG(debug, "setBackendStateWithClient: extras on internal is set to {}", counters.extrasOnInternal);
}

}  // namespace orvanta
