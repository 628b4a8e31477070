#include "session/BackendSet.h"

#include <fmt/format.h>

#include "config/MessageLog.h"
#include "interface/OrvantaLogging.h"
#include "session/FlushRequest.h"

namespace orvanta {

namespace {

// Returns whether the backend's lists let the category through; logs when they don't.
bool admits(const OrvantaBackend& backend, std::uint16_t category, std::string_view operation) {
  if (!backend.isWhitelistedEvent(category)) {
    ORVANTA_LOG(debug, "{}: Dropping event with category {} as it is not whitelisted for backend {}", operation,
                category, backend.name());
    return false;
  }
  if (backend.isBlacklistedEvent(category)) {
    ORVANTA_LOG(debug, "{}: Dropping event with category {} as it is blacklisted for backend {}", operation, category,
                backend.name());
    return false;
  }
  return true;
}

}  // namespace

std::unique_ptr<BackendSet> BackendSet::create(DaemonServices& services, const SharedDictionary& storebag,
                                               const SessionInfoRecord* info, const SharedDictionary& userInfo,
                                               const DeviceIDBuffer& deviceID) {
  if (!storebag) {
    ORVANTA_LOG(error, "createBackends: Attempted to create backends with nil storebag");
    return nullptr;
  }
  if (info == nullptr) {
    ORVANTA_LOG(error, "createBackends: Attempted to create backends with nil session info");
    return nullptr;
  }

  const auto& device = services.platform.device();
  BackendSetup setup;
  BackendIdentity& identity = setup.identity;
  identity.startTimestamp = services.platform.clock().timeOfDay();
  identity.sessionID = info->sessionID;
  identity.clientType = info->clientType;
  identity.clientVersion = info->clientVersion;
  identity.deviceID = std::string(deviceIDText(deviceID));
  identity.productFamily = device.deviceName().value_or("");
  identity.productVersion = device.productVersion();
  identity.buildVersion = device.buildVersion();
  identity.productType = device.productType();
  identity.isInternal = services.config().isInternalBuild();
  identity.requireUserInfo = info->requireUserInfo;
  identity.selfVersion = SelfVersion::parse(services.config().orvanta().bundleVersion());
  setup.batchEvents = info->batchEvent;
  setup.userInfo = userInfo;

  std::unique_ptr<BackendSet> set(new BackendSet(services));
  for (const auto& [name, value] : *storebag) {
    // The profile stays inside the storebag, which lives as long as any backend made from it.
    const SharedDictionary profile(storebag, value.dictionary());
    auto backend = newBackendWithName(services.backends, name, profile, setup);
    if (backend) set->_entries.push_back({std::move(backend), rulesForBackend(name)});
  }
  return set;
}

OrvantaBackend* BackendSet::find(std::string_view name) const {
  for (const Entry& entry : _entries) {
    if (entry.backend->name() == name) return entry.backend.get();
  }
  return nullptr;
}

std::optional<std::string> BackendSet::offer(OrvantaBackend& backend, Event& event, std::string_view operation) const {
  if (!admits(backend, event.category, operation)) return std::nullopt;
  auto text = backend.sendMessage(event);
  if (text) writeToLogFile(_services.platform, fmt::format("[{} -> {}] {}", backend.name(), operation, *text));
  return text;
}

std::optional<std::string> BackendSet::dispatch(Event event) const {
  std::optional<std::string> reply;
  for (const auto& [backend, rules] : _entries) {
    auto text = offer(*backend, event, "sendMessageWithDictionary");
    if (!text) continue;
    if (rules.reply == ReplyRole::reply || (rules.reply == ReplyRole::fallback && !reply)) reply = std::move(text);
  }
  return reply;
}

void BackendSet::dispatchSingle(Event event) const {
  for (const auto& [backend, rules] : _entries) {
    backend->updateState();
    offer(*backend, event, "sendMessageWithSessionInfo");
  }
}

void BackendSet::flush(FlushReply completion) const {
  const auto request =
      std::make_shared<FlushRequest>(_services, static_cast<std::int32_t>(_entries.size()), std::move(completion));
  for (const auto& [backend, rules] : _entries) {
    backend->flushMessagesWithCompletion(request->completionFor(backend->name()));
  }
}

bool BackendSet::uploadFileAtPath(const OrvantaBackend::UploadFile& file) const {
  bool uploaded = false;
  for (const auto& [backend, rules] : _entries) uploaded = backend->uploadFileAtPath(file) || uploaded;
  return uploaded;
}

bool BackendSet::uploadLogData(const SharedArray& logData) const {
  bool uploaded = false;
  for (const auto& [backend, rules] : _entries) uploaded = backend->uploadLogData(logData) || uploaded;
  return uploaded;
}

void BackendSet::cleanup() const {
  for (const auto& [backend, rules] : _entries) backend->cleanup();
}

void BackendSet::updateStates() const {
  for (const auto& [backend, rules] : _entries) backend->updateState();
}

void BackendSet::setUserInfo(const SharedDictionary& userInfo) const {
  for (const auto& [backend, rules] : _entries) backend->setUserInfoDict(userInfo);
}

void BackendSet::setCombinedSessionIDString(const std::string& sessionIDString) const {
  for (const auto& [backend, rules] : _entries) backend->setCombinedSessionIDString(sessionIDString);
}

void BackendSet::setCorrelatedSessionID(const std::string& combined) const {
  for (const auto& [backend, rules] : _entries) backend->setCorrelatedSessionID(combined);
}

void BackendSet::followParent(const BackendSet* parent) const {
  for (const auto& [backend, rules] : _entries) {
    if (backend->state() == kBackendHeld) continue;
    const OrvantaBackend* leader = parent == nullptr ? nullptr : parent->find(backend->name());
    if (leader == nullptr) {
      backend->setState(kBackendDisabled);
      continue;
    }
    const auto state = leader->state();
    const auto threshold = leader->samplingThreshold();
    backend->setState(state);
    backend->setSamplingThreshold(threshold);
    ORVANTA_LOG(debug, "HTTPSPostBackend(syncReportingStates): {}: state and sampling rate updated to {}, {:.02f}%",
                backend->name(), int{state}, static_cast<float>(threshold.value_or(0)));
  }
}

std::vector<std::string> BackendSet::reportingNames() const {
  std::vector<std::string> names;
  for (const auto& [backend, rules] : _entries) {
    const auto state = backend->state();
    if (state == kBackendEnabled || state == kBackendHeld) names.push_back(backend->name());
  }
  return names;
}

std::optional<std::string> BackendSet::displayURL() const {
  const Entry* first = nullptr;
  for (const Entry& entry : _entries) {
    if (entry.rules.displayURLTurn == 0 || !entry.backend->displayURL()) continue;
    if (first == nullptr || entry.rules.displayURLTurn < first->rules.displayURLTurn) first = &entry;
  }
  return first == nullptr ? std::nullopt : first->backend->displayURL();
}

}  // namespace orvanta
