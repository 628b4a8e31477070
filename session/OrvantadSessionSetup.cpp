#include <fmt/format.h>

#include "interface/OrvantaLogging.h"
#include "session/OrvantadSession.h"

// Configuration: the session's records, its backends, user info, and what follows the parent in a hierarchy.

namespace orvanta {

namespace {

bool sameText(const SharedDictionary& a, const SharedDictionary& b, std::string_view key) {
  const Value* left = a ? a->find(key) : nullptr;
  const Value* right = b ? b->find(key) : nullptr;
  return left != nullptr && right != nullptr && left->string() != nullptr && right->string() != nullptr &&
         *left->string() == *right->string();
}

}  // namespace

void OrvantadSession::setSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                     SharedArray frameworksToCheck, bool hasAggregationBlock, DoneReply done) {
  if (auto problem = refusalOfHierarchy(*sessionInfo)) {
    ORVANTA_LOG(warning, "setSessionInfo: Refused for session {}: {}", _sessionID, *problem);
    done.fail({"setSessionInfo: " + *problem});
    return;
  }
  const SessionInfoRecord info = SessionInfoRecord::read(*sessionInfo);
  {
    const auto lock = lockSharedFields(HierarchyPosition::read(*sessionInfo).token.has_value());
    _sessionID = info.sessionID;
    ORVANTA_LOG(debug, "setSessionInfo: Configuring session {}", _sessionID);
    if (userInfo && !info.requireUserInfo) {
      ORVANTA_LOG(warning, "setSessionInfo: Configure session: user info provided without requiring it");
    }
    configure(std::move(sessionInfo));
    _frameworks = std::move(frameworksToCheck);
    _userInfo = std::move(userInfo);
    const std::lock_guard aggregation(_aggregationLock);
    _hasAggregator.store(hasAggregationBlock, std::memory_order_release);
  }
  done();
}

void OrvantadSession::configure(SharedDictionary sessionInfo) {
  const auto lock = lockSharedFields(HierarchyPosition::read(*sessionInfo).token.has_value());
  _info = SessionInfoRecord::read(*sessionInfo);
  _sessionID = _info.sessionID;
  _hierarchy = HierarchyPosition::read(*sessionInfo);
  _sessionInfo = std::move(sessionInfo);
  _delegate.updateCorrelatedSessions(shared_from_this());
}

void OrvantadSession::startConfigWithCompletionHandler(BackendNamesReply completion) {
  ORVANTA_LOG(debug, "startConfigWithCompletionHandler: Starting configuration for session {}", _sessionID);
  const SharedDictionary storebag = _delegate.storebagForSession(*this);
  if (!storebag) {
    replaceBackends(std::nullopt);
    completion(std::nullopt);
    return;
  }
  _storebagVersion = _delegate.storebagVersionForSession(*this);
  createBackendsWithStorebag(storebag);
  updateSessionWithDefaultSessionInfo();
  sendStartMessage();
  if (completion) completion(fetchReportingStates());
}

void OrvantadSession::createBackendsWithStorebag(const SharedDictionary& storebag) {
  ORVANTA_LOG(debug, "createBackendsWithStorebag: Creating backends for session {}", _sessionID);
  auto backends = createBackends(_services, storebag, _sessionInfo, _userInfo, _deviceid);
  if (backends) {
    for (const auto& [key, backend] : *backends) backend->setCombinedSessionIDString(_sessionIDString);
  }
  replaceBackends(std::move(backends));
}

void OrvantadSession::replaceBackends(std::optional<BackendSet> backends) {
  {
    const auto lock = lockSharedFields();
    _backends.swap(backends);
  }
  // A session that is started again lets go of its earlier backends as one that ends does.
  if (backends) {
    for (const auto& [key, backend] : *backends) backend->cleanup();
  }
}

void OrvantadSession::sendStartMessage() {
  const auto& device = _platform.device();
  const auto known = [](std::optional<std::string> fact) { return Value(std::move(fact).value_or("Unknown")); };
  auto payload = std::make_shared<Dictionary>();
  if (_services.config().isInternalBuild()) {
    payload->set("SerialNum", known(device.serialNumber()));
    payload->set("Version", known(device.productVersion()));
    payload->set("Build", known(device.buildVersion()));
    payload->set("Hardware", known(device.hardwareModel()));
    payload->set("Product", known(device.deviceName()));
    payload->set("ReportVers", _services.config().orvanta().bundleVersion());
  }
  payload->set("Locale", known(device.countryCode()));
  payload->set("AutomaticTimeSet", device.automaticTimeZone().value_or(true));
  internalSendMessage(std::move(payload), 0, 0);
}

void OrvantadSession::fetchStatesWithUserInfo(SharedDictionary userInfo, BackendNamesReply completion) {
  ORVANTA_LOG(debug, "fetchStatesWithUserInfo: Fetching states for session {}", _sessionID);
  receivedUserInfo(std::move(userInfo));
  if (completion) completion(fetchReportingStates());
}

void OrvantadSession::receivedUserInfo(SharedDictionary userInfo) {
  if (!userInfo && (!_userInfo || _info.requireUserInfo)) return;
  const bool sameNames = sameText(userInfo, _userInfo, kOrvantaUserInfoClientName) &&
                         sameText(userInfo, _userInfo, kOrvantaUserInfoServiceName);
  {
    const auto lock = lockSharedFields();
    _userInfo.swap(userInfo);
  }
  updateUserInfoForBackends();
  if (sameNames) return;
  ORVANTA_LOG(debug, "receivedUserInfo: Received new user info for session {}", _sessionID);
  updateSessionWithDefaultSessionInfo();
}

void OrvantadSession::updateUserInfoForBackends() {
  if (!_backends) return;
  for (const auto& [key, backend] : *_backends) backend->setUserInfoDict(_userInfo);
}

void OrvantadSession::updateReportingStates() {
  if (!_backends) return;
  for (const auto& [key, backend] : *_backends) backend->updateState();
}

void OrvantadSession::updateSessionWithDefaultSessionInfo() {
  updateReportingStates();
  _delegate.updateDownstreamSessions(*this);
}

void OrvantadSession::syncReportingStates() {
  const std::lock_guard lock(_delegate.lock());
  const auto parent = _delegate.parentSessionForChild(*this);
  if (!_backends) return;
  for (const auto& [key, backend] : *_backends) {
    if (!parent) {
      if (hierarchyLevel() != 0) {
        ORVANTA_LOG(info, "syncReportingStates: child session {} (backend {}) with hierarchy {} is missing its parent",
                    _sessionID, backend->name(), hierarchyLevel());
      }
      continue;
    }
    if (backend->state() == kBackendHeld) continue;
    const auto* parents = parent->_backends ? parent->_backends->find(key) : nullptr;
    if (parents == nullptr) {
      backend->setState(kBackendDisabled);
      continue;
    }
    const auto state = parents->state();
    const auto threshold = parents->samplingThreshold();
    backend->setState(state);
    backend->setSamplingThreshold(threshold);
    ORVANTA_LOG(debug, "HTTPSPostBackend(syncReportingStates): {}: state and sampling rate updated to {}, {:.02f}%",
                backend->name(), int{state}, static_cast<float>(threshold.value_or(0)));
  }
}

BackendNames OrvantadSession::fetchReportingStates() const {
  if (!_backends) return std::nullopt;
  std::vector<std::string> names;
  for (const auto& [key, backend] : *_backends) {
    const auto state = backend->state();
    if (state == kBackendEnabled || state == kBackendHeld) names.push_back(backend->name());
  }
  return names;
}

void OrvantadSession::updateCombinedSessionID() {
  const auto parentID = _delegate.parentSessionIDStringForSession(*this);
  if (!parentID) return;
  const std::string combined = fmt::format("{}.{}", *parentID, _sessionIDString);
  ORVANTA_LOG(debug, "updateCombinedSessionID: Updating combined session ID '{}' for session {} backends", combined,
              _sessionID);
  if (!_backends) return;
  for (const auto& [key, backend] : *_backends) backend->setCorrelatedSessionID(combined);
}

void OrvantadSession::fetchDisplayURL(StringReply reply) {
  ORVANTA_LOG(debug, "fetchDisplayURL: Fetching display URL for session {}", _sessionID);
  for (const auto name : {kOrvantaBackendHTTPPost, kOrvantaBackendHTTPPost2, kOrvantaBackendDashboard}) {
    const auto* backend = _backends ? _backends->find(name) : nullptr;
    if (backend != nullptr && backend->displayURL()) {
      reply(backend->displayURL());
      return;
    }
  }
  reply("URL not available");
}

void OrvantadSession::finishSessionWithReply(StringReply reply) {
  ORVANTA_LOG(debug, "finishSessionWithReply: Finishing session {}", _sessionID);
  reply(send(0, 2, nullptr));
}

}  // namespace orvanta
