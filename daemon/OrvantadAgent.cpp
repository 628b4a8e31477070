#include "daemon/OrvantadAgent.h"

#include "daemon/SessionConnection.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {

namespace {
// A change to a session with more than these below it takes milliseconds.
constexpr std::size_t kLargeGroup = 64;
}  // namespace

OrvantadAgent::OrvantadAgent(DaemonServices& services)
    : OrvantadAgent(services, [&services](std::int32_t clientType, StorebagFetch& fetch) {
        return fetchStorebagForEnvironmentAndClientType(services.config(), clientType, fetch);
      }) {}

OrvantadAgent::OrvantadAgent(DaemonServices& services, StorebagCache::Fetch fetch)
    : _services(services), _sessionList(services.platform), _storebags(services.platform.clock(), std::move(fetch)) {}

bool OrvantadAgent::listenerShouldAcceptNewConnection(platform::OfferedConnection&& offered) {
  const auto& connection = offered.connection;
  if (!_services.entitlements.holds(offered.peer, kOrvantaEntitlement)) {
    ORVANTA_LOG(debug,
                "listener: new Vyx connection {} does not have required orvanta entitlement. Closing connection...",
                connection->description());
    return false;
  }
  ORVANTA_LOG(debug, "listener: Accepting new Vyx connection {} as it has proper entitlement, {}({}) connections.",
              connection->description(), _sessionList.openCount(), _tokenCount.load(std::memory_order_relaxed));
  const auto session = OrvantadSession::create(_services, *this, connection);
  const auto handler = std::make_shared<SessionConnection>(*this, session, connection);
  if (!_sessionList.admit(*session, handler)) {
    session->end();
    return false;
  }
  connection->resume(handler);
  return true;
}

void OrvantadAgent::invalidated(const std::shared_ptr<OrvantadSession>& session) {
  _sessionList.leave(*session);
  if (!session->isInGroup()) return;
  const AgentLock::Held lock(_lock);
  _registry.remove(*session);
  session->setInGroup(false);
}

SharedDictionary OrvantadAgent::storebagForSession(OrvantadSession& session) {
  ORVANTA_LOG(debug, "storebagForSession: Retrieving storebag for session {} with client type {}", session.sessionID(),
              session.clientType());
  const AgentLock::Held lock(_lock);
  return _storebags.storebag(session.clientType());
}

std::optional<std::string> OrvantadAgent::storebagVersionForSession(OrvantadSession& session) {
  const AgentLock::Held lock(_lock);
  return _storebags.version(session.clientType());
}

void OrvantadAgent::updateCorrelatedSessions(const std::shared_ptr<OrvantadSession>& session) {
  if (!session->hierarchyToken()) {
    ORVANTA_LOG(info, "updateCorrelatedSessions: Session {} has no correlated sessions as it is a standalone session",
                session->sessionID());
    if (!session->isInGroup()) return;
  }
  const AgentLock::Held lock(_lock);
  _registry.update(session);
  _tokenCount.store(_registry.tokenCount(), std::memory_order_relaxed);
  session->setInGroup(session->hierarchyToken().has_value());
}

std::optional<std::string> OrvantadAgent::parentSessionIDStringForSession(OrvantadSession& session) {
  if (session.hierarchyLevel() == 0 || !session.hierarchyToken()) return std::nullopt;
  ORVANTA_LOG(debug, "parentSessionIDStringForSession: Checking hierarchyToken '{}' for session {}",
              *session.hierarchyToken(), session.sessionID());
  const AgentLock::Held lock(_lock);
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
  const AgentLock::Held lock(_lock);
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
