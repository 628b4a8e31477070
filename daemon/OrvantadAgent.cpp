#include "daemon/OrvantadAgent.h"

#include <algorithm>
#include <chrono>

#include "daemon/DaemonPlatform.h"
#include "daemon/SessionConnection.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "platform/host/MemoryUse.h"

namespace orvanta {

namespace {
constexpr std::chrono::seconds kBetweenReleases{10};
constexpr std::chrono::milliseconds kTimeToRead{1000};
constexpr std::chrono::seconds kEndOfSessions{8};
// Above that, what a change does to those below it takes milliseconds.
constexpr std::size_t kLargeGroup = 64;
}  // namespace

OrvantadAgent::OrvantadAgent(Platform& platform)
    : OrvantadAgent(platform, [&platform](std::int32_t clientType, StorebagFetch& fetch) {
        return fetchStorebagForEnvironmentAndClientType(platform, clientType, fetch);
      }) {}

OrvantadAgent::OrvantadAgent(Platform& platform, StorebagCache::Fetch fetch)
    : _platform(platform),
      _entitlements(entitlementsOf(platform)),
      _status(platform.pool()),
      _storebags(platform.clock(), std::move(fetch)) {}

bool OrvantadAgent::listenerShouldAcceptNewConnection(platform::OfferedConnection&& offered) {
  const auto& connection = offered.connection;
  if (!_entitlements.holds(offered.peer, kOrvantaEntitlement)) {
    ORVANTA_LOG(debug,
                "listener: new Vyx connection {} does not have required orvanta entitlement. Closing connection...",
                connection->description());
    return false;
  }
  ORVANTA_LOG(debug, "listener: Accepting new Vyx connection {} as it has proper entitlement, {}({}) connections.",
              connection->description(), sessionCount(), _registry.tokenCount());
  const auto session = OrvantadSession::create(_platform, *this, connection);
  const auto handler = std::make_shared<SessionConnection>(*this, session, connection);
  bool admitted = false;
  {
    const std::lock_guard lock(_sessionListLock);
    if (!_ending) {
      if (_sessionList.empty()) _platform.keepAlive().begin();
      _sessionList.push_back({session, handler});
      _status.changed(_sessionList.size());
      ++_unended;
      ++_connected;
      admitted = true;
    }
  }
  if (!admitted) {
    session->end();
    return false;
  }
  connection->resume(handler);
  return true;
}

void OrvantadAgent::invalidated(const std::shared_ptr<OrvantadSession>& session) {
  Entry removed;  // dropped outside the lock
  {
    const std::lock_guard lock(_sessionListLock);
    const auto found = std::find_if(_sessionList.begin(), _sessionList.end(),
                                    [&session](const Entry& entry) { return entry.session == session; });
    if (found != _sessionList.end()) {
      removed = std::move(*found);
      _sessionList.erase(found);
      _status.changed(_sessionList.size());
      if (_sessionList.empty()) _platform.keepAlive().end();
    }
  }
  if (!session->isInGroup()) return;
  const std::lock_guard lock(_lock);
  _registry.remove(*session);
  session->setInGroup(false);
}

void OrvantadAgent::sessionEnded() {
  const std::lock_guard lock(_sessionListLock);
  if (--_unended > 0) return;
  _allEnded.notify_all();
  if (!_ending) releaseMemoryWhenIdle();
}

void OrvantadAgent::connectionEnded() {
  const std::lock_guard lock(_sessionListLock);
  if (--_connected == 0) _allEnded.notify_all();
}

// Nobody is here: what the sessions used may go. Not at each of many short visits.
void OrvantadAgent::releaseMemoryWhenIdle() {
  const auto now = std::chrono::steady_clock::now();
  if (now - _memoryReleased < kBetweenReleases) return;
  _memoryReleased = now;
  _platform.pool().post([] {
    const platform::BlockingScope blocking;
    platform::releaseUnusedMemory();
  });
}

bool OrvantadAgent::endAllSessions() {
  std::vector<Entry> entries;
  {
    const std::lock_guard lock(_sessionListLock);
    _ending = true;
    entries = _sessionList;
  }
  for (const auto& entry : entries) {
    entry.connection->connection()->queue()->post([handler = entry.connection] {
      handler->endSession();
      // What the client has still to hear, such as the end of its aggregation, may take it a moment to read.
      handler->connection()->cancel(kTimeToRead);
    });
  }
  // Also those whose clients have just left by themselves and that are no longer in the list.
  std::unique_lock lock(_sessionListLock);
  if (_allEnded.wait_for(lock, kEndOfSessions, [this] { return _unended == 0; })) return true;
  ORVANTA_LOG(error, "main: {} sessions are still busy and are left behind", _unended);
  return false;
}

void OrvantadAgent::waitForClients() {
  std::unique_lock lock(_sessionListLock);
  _allEnded.wait_for(lock, kTimeToRead + std::chrono::milliseconds(500), [this] { return _connected == 0; });
}

std::size_t OrvantadAgent::sessionCount() const {
  const std::lock_guard lock(_sessionListLock);
  return _sessionList.size();
}

SharedDictionary OrvantadAgent::storebagForSession(OrvantadSession& session) {
  ORVANTA_LOG(debug, "storebagForSession: Retrieving storebag for session {} with client type {}", session.sessionID(),
              session.clientType());
  const std::lock_guard lock(_lock);
  return _storebags.storebag(session.clientType());
}

std::optional<std::string> OrvantadAgent::storebagVersionForSession(OrvantadSession& session) {
  const std::lock_guard lock(_lock);
  return _storebags.version(session.clientType());
}

void OrvantadAgent::updateCorrelatedSessions(const std::shared_ptr<OrvantadSession>& session) {
  if (!session->hierarchyToken()) {
    ORVANTA_LOG(info, "updateCorrelatedSessions: Session {} has no correlated sessions as it is a standalone session",
                session->sessionID());
    if (!session->isInGroup()) return;
  }
  const std::lock_guard lock(_lock);
  _registry.update(session);
  session->setInGroup(session->hierarchyToken().has_value());
}

std::optional<std::string> OrvantadAgent::parentSessionIDStringForSession(OrvantadSession& session) {
  if (session.hierarchyLevel() == 0 || !session.hierarchyToken()) return std::nullopt;
  ORVANTA_LOG(debug, "parentSessionIDStringForSession: Checking hierarchyToken '{}' for session {}",
              *session.hierarchyToken(), session.sessionID());
  const std::lock_guard lock(_lock);
  return _registry.parentSessionIDStringForSession(session);
}

std::shared_ptr<OrvantadSession> OrvantadAgent::parentSessionForChild(OrvantadSession& session) {
  return _registry.parentSessionForChild(session);
}

std::shared_ptr<OrvantadSession> OrvantadAgent::getAncestorWithAggregatorForSession(OrvantadSession& session) {
  return _registry.getAncestorWithAggregatorForSession(session);
}

void OrvantadAgent::updateDownstreamSessions(OrvantadSession& session) {
  if (!session.hasUserInfo()) {
    ORVANTA_LOG(info, "updateDownstreamSessions: No user info found for session {}", session.sessionID());
    return;
  }
  if (!session.hierarchyToken()) return;
  const std::lock_guard lock(_lock);
  session.updateCombinedSessionID();
  session.syncReportingStates();
  bool aggregatedAbove = false;
  if (session.hierarchyLevel() >= 1 && _registry.getAncestorWithAggregatorForSession(session)) {
    session.shutdownSessionAggregation();
    aggregatedAbove = true;
  }
  const auto downstream = _registry.downstreamOf(session);
  std::optional<platform::BlockingScope> large;
  if (downstream.size() > kLargeGroup) large.emplace();
  for (const auto& deeper : downstream) {
    ORVANTA_LOG(debug,
                "updateDownstreamSessions: Updating combined session ID and syncing reporting states for session {}",
                deeper->sessionID());
    deeper->updateCombinedSessionID();
    deeper->syncReportingStates();
    if ((session.hasAggregator() || aggregatedAbove) && deeper->hasAggregator()) deeper->shutdownSessionAggregation();
  }
}

}  // namespace orvanta
