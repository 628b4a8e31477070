// HTTPSPostBackend: its evaluation, from the facts to the settings taken.

#include "backends/https/ClientSection.h"
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
  // Nothing is stored for a frozen state: the store would undo what a server's answer or a parent session sets
  // meanwhile.
  if (!_immutable) setState(updateBackendState());
}

BackendState HTTPSPostBackend::updateBackendState() {
  if (_immutable) return state();
  const ReportingFacts facts = gatherFacts();
  ReportingDecision decision = evaluate(*profile(), facts);
  const BackendState decided = decision.state;
  apply(std::move(decision), facts);
  return decided;
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
  facts.postURLFixed = _useDefaultPostURL && postURL().has_value();
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
    for (const auto* section : settings.linkSections) updatePostLink(*section);
  }
  if (settings.counters) resetBackendStateWithClient(*settings.counters);
  if (settings.customClientID) {
    _clientIdentity.setUuidCustom(
        getPersistentIdentifierForCustomClientIDSuffix(platform(), facts.clientName, facts.serviceName));
  }
  if (facts.requireUserInfo && settings.sampling) {
    ORVANTA_LOG(debug, "HTTPSPostBackend(updateBackendState): {}: client found {}:{}, state={}, samplingFactor={:f}",
                name(), orNull(facts.clientName), orNull(facts.serviceName), int{decision.state}, facts.samplingFactor);
    for (const auto* section : settings.linkSections) updatePostLink(*section);
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

bool HTTPSPostBackend::updatePostLink(const Dictionary& section) {
  bool supplied = false;
  std::optional<std::string> postURL = this->postURL();
  if (!_useDefaultPostURL || !postURL) {
    _useDefaultPostURL = false;
    if (const std::string* url = textUnder(section, StorebagKey::postURL)) {
      postURL = *url;
      setPostURL(*url);
      ORVANTA_LOG(debug, "HTTPSPostBackend(updatePostLink): Storebag '{}' for postURL", *url);
      supplied = true;
    }
  }
  if (!_useDefaultRealtimePostURL || !_realtimePostURL) {
    _useDefaultRealtimePostURL = false;
    if (const std::string* url = textUnder(section, StorebagKey::realtimePostURL)) {
      _realtimePostURL = *url;
      ORVANTA_LOG(debug, "HTTPSPostBackend(updatePostLink): Storebag '{}' for realtimePostURL", *url);
    } else {
      ORVANTA_LOG(debug, "HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '{}'", orNull(postURL));
      _realtimePostURL = std::move(postURL);
    }
  }
  return supplied;
}

void HTTPSPostBackend::resetBackendStateWithClient(const ReportingSettings::Counters& counters) {
  _eventThreshold = counters.eventThreshold;
  ORVANTA_LOG(debug, "resetBackendStateWithClient: event_threshold set to {}", counters.eventThreshold);
  _clientIdentity.setExtrasOnInternal(counters.extrasOnInternal);
  ORVANTA_LOG(debug, "setBackendStateWithClient: extras on internal is set to {}", counters.extrasOnInternal);
}

std::optional<std::string> HTTPSPostBackend::postURL() const {
  const std::lock_guard lock(mutex());
  return _postURL;
}

void HTTPSPostBackend::setPostURL(std::optional<std::string> url) {
  const std::lock_guard lock(mutex());
  _postURL.swap(url);
}

}  // namespace orvanta
