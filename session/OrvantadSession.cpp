#include "session/OrvantadSession.h"

#include <fmt/format.h>

#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "platform/codec/PropertyList.h"
#include "platform/host/Digest.h"

// A session's life and description: its records, its backends, user info, and what follows the parent in a hierarchy.

namespace orvanta {

namespace {

bool sameText(const SharedDictionary& a, const SharedDictionary& b, std::string_view key) {
  const std::string* left = a ? a->text(key) : nullptr;
  const std::string* right = b ? b->text(key) : nullptr;
  return left != nullptr && right != nullptr && *left == *right;
}

}  // namespace

std::shared_ptr<OrvantadSession> OrvantadSession::create(DaemonServices& services, OrvantadSessionDelegate& delegate,
                                                         std::shared_ptr<platform::Connection> connection) {
  return std::shared_ptr<OrvantadSession>(new OrvantadSession(services, delegate, std::move(connection)));
}

OrvantadSession::OrvantadSession(DaemonServices& services, OrvantadSessionDelegate& delegate,
                                 std::shared_ptr<platform::Connection> connection)
    : _services(services),
      _platform(services.platform),
      _delegate(delegate),
      _connection(std::move(connection)),
      _aggregation(_connection ? _connection->outbox() : nullptr) {
  ORVANTA_LOG(debug, "initWithSessionDelegate: OrvantadSession initWithSessionDelegate:<OrvantadAgent: {}>",
              static_cast<const void*>(&_delegate));
  copyUniqueDeviceID(_platform, _deviceid);
  _sessionIDString = platform::encodeBase64(platform::randomUuid());
  ORVANTA_LOG(debug, "initWithSessionDelegate: Initialized session with UUID {}", _sessionIDString);
}

OrvantadSession::~OrvantadSession() {
  if (!_ended) ORVANTA_LOG(error, "dealloc: OrvantadSession {} was dropped before it ended", _sessionIDString);
}

std::string OrvantadSession::description() const {
  return fmt::format("<OrvantadSession: {} {}>", _sessionIDString,
                     _connection ? _connection->description() : "without connection");
}

std::unique_lock<AgentLock> OrvantadSession::lockSharedFields(bool joiningGroup) {
  if (joiningGroup || _inGroup) return std::unique_lock(_delegate.lock());
  return {};
}

void OrvantadSession::setSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                     SharedArray frameworksToCheck, bool hasAggregationBlock, DoneReply done) {
  auto info = SessionInfoRecord::read(*sessionInfo);
  if (auto problem = info.hierarchy.refusal()) {
    ORVANTA_LOG(warning, "setSessionInfo: Refused for session {}: {}", sessionID(), *problem);
    done.fail({"setSessionInfo: " + *problem});
    return;
  }
  {
    const auto lock = lockSharedFields(info.hierarchy.token.has_value());
    ORVANTA_LOG(debug, "setSessionInfo: Configuring session {}", info.sessionID);
    if (userInfo && !info.requireUserInfo) {
      ORVANTA_LOG(warning, "setSessionInfo: Configure session: user info provided without requiring it");
    }
    configure(std::move(sessionInfo), std::move(info));
    _frameworks = std::move(frameworksToCheck);
    _userInfo = std::move(userInfo);
    _aggregation.setHasAggregator(hasAggregationBlock);
  }
  done();
}

void OrvantadSession::configure(SharedDictionary sessionInfo, SessionInfoRecord info) {
  const auto lock = lockSharedFields(info.hierarchy.token.has_value());
  _info = std::move(info);
  _sessionInfo = std::move(sessionInfo);
  _delegate.updateCorrelatedSessions(shared_from_this());
}

void OrvantadSession::startConfigWithCompletionHandler(BackendNamesReply completion) {
  ORVANTA_LOG(debug, "startConfigWithCompletionHandler: Starting configuration for session {}", sessionID());
  const SharedDictionary storebag = _delegate.storebagForSession(*this);
  if (!storebag) {
    replaceBackends(nullptr);
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
  ORVANTA_LOG(debug, "createBackendsWithStorebag: Creating backends for session {}", sessionID());
  auto backends = BackendSet::create(_services, storebag, _sessionInfo ? &_info : nullptr, _userInfo, _deviceid);
  if (backends) backends->setCombinedSessionIDString(_sessionIDString);
  replaceBackends(std::move(backends));
}

void OrvantadSession::replaceBackends(std::unique_ptr<BackendSet> backends) {
  {
    const auto lock = lockSharedFields();
    _backends.swap(backends);
  }
  if (backends) backends->cleanup();
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
  ORVANTA_LOG(debug, "fetchStatesWithUserInfo: Fetching states for session {}", sessionID());
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
  if (_backends) _backends->setUserInfo(_userInfo);
  if (sameNames) return;
  ORVANTA_LOG(debug, "receivedUserInfo: Received new user info for session {}", sessionID());
  updateSessionWithDefaultSessionInfo();
}

void OrvantadSession::updateSessionWithDefaultSessionInfo() {
  if (_backends) _backends->updateStates();
  _delegate.updateDownstreamSessions(*this);
}

void OrvantadSession::syncReportingStates() {
  const AgentLock::Held lock(_delegate.lock());
  const auto parent = _delegate.parentSessionForChild(*this);
  if (!_backends) return;
  if (parent) {
    _backends->followParent(parent->_backends.get());
    return;
  }
  if (hierarchyLevel() == 0) return;
  for (const auto& [backend, rules] : *_backends) {
    ORVANTA_LOG(info, "syncReportingStates: child session {} (backend {}) with hierarchy {} is missing its parent",
                sessionID(), backend->name(), hierarchyLevel());
  }
}

BackendNames OrvantadSession::fetchReportingStates() const {
  if (!_backends) return std::nullopt;
  return _backends->reportingNames();
}

void OrvantadSession::updateCombinedSessionID() {
  const auto parentID = _delegate.parentSessionIDStringForSession(*this);
  if (!parentID) return;
  const std::string combined = fmt::format("{}.{}", *parentID, _sessionIDString);
  ORVANTA_LOG(debug, "updateCombinedSessionID: Updating combined session ID '{}' for session {} backends", combined,
              sessionID());
  if (_backends) _backends->setCorrelatedSessionID(combined);
}

void OrvantadSession::fetchDisplayURL(StringReply reply) {
  ORVANTA_LOG(debug, "fetchDisplayURL: Fetching display URL for session {}", sessionID());
  reply((_backends ? _backends->displayURL() : std::nullopt).value_or("URL not available"));
}

void OrvantadSession::finishSessionWithReply(StringReply reply) {
  ORVANTA_LOG(debug, "finishSessionWithReply: Finishing session {}", sessionID());
  reply(send(0, 2, nullptr));
}

void OrvantadSession::end() {
  if (_ended) return;
  ORVANTA_LOG(debug, "dealloc: OrvantadSession dealloc: {}", sessionID());

  auto payload = std::make_shared<Dictionary>();
  if (_storebagVersion) payload->set("StorebagVersion", *_storebagVersion);
  internalSendMessage(std::move(payload), 0, 1);
  flushMessagesWithCompletion({});
  shutdownSessionAggregation();
  if (_backends) _backends->cleanup();
  _ended = true;

  // Moved out first, so that they are destroyed outside the lock.
  std::unique_ptr<BackendSet> backends;
  SharedDictionary userInfo;
  {
    const auto lock = lockSharedFields();
    backends.swap(_backends);
    userInfo.swap(_userInfo);
  }
}

}  // namespace orvanta
