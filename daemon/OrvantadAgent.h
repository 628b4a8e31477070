#pragma once

#include <atomic>
#include <cstddef>
#include <memory>

#include "daemon/SessionList.h"
#include "daemon/SessionRegistry.h"
#include "daemon/StorebagCache.h"
#include "interface/Values.h"
#include "platform/listen/Listener.h"
#include "session/DaemonServices.h"
#include "session/OrvantadSession.h"
#include "session/OrvantadSessionDelegate.h"

namespace orvanta {

// The one agent of the process: admits clients, owns their sessions, and holds what sessions share, the storebag cache
// and the registry of related sessions.
//
// Made by main and outlives every session. Admission and invalidation come from connection queues, several at once; the
// delegate operations from any session's queue. The session list's lock and the agent's lock are never held together.
// A peer that may not connect is refused with a log line.
class OrvantadAgent final : public OrvantadSessionDelegate {
 public:
  explicit OrvantadAgent(DaemonServices& services);
  // `fetch` stands for the storebag server.
  OrvantadAgent(DaemonServices& services, StorebagCache::Fetch fetch);

  // The listener's handler: returns whether the peer was admitted. Only peers that hold the entitlement are.
  bool listenerShouldAcceptNewConnection(platform::OfferedConnection&& offered);

  // A client has gone, or the process is about to end: takes the session out of the list and its group. On the
  // session's queue; a second call does nothing.
  void invalidated(const std::shared_ptr<OrvantadSession>& session);

  SessionList& sessions() { return _sessionList; }

  AgentLock& lock() override RETURN_CAPABILITY(_lock) { return _lock; }
  SharedDictionary storebagForSession(OrvantadSession& session) override;
  std::optional<std::string> storebagVersionForSession(OrvantadSession& session) override;
  void updateCorrelatedSessions(const std::shared_ptr<OrvantadSession>& session) override;
  std::optional<std::string> parentSessionIDStringForSession(OrvantadSession& session) override;
  void updateDownstreamSessions(OrvantadSession& session) override;
  std::shared_ptr<OrvantadSession> parentSessionForChild(OrvantadSession& session) override REQUIRES(_lock);
  std::shared_ptr<OrvantadSession> getAncestorWithAggregatorForSession(OrvantadSession& session) override
      REQUIRES(_lock);

 private:
  DaemonServices& _services;

  SessionList _sessionList;
  std::atomic<std::size_t> _tokenCount{0};  // the registry's; admission reads it without the lock

  AgentLock _lock;
  StorebagCache _storebags GUARDED_BY(_lock);
  SessionRegistry _registry GUARDED_BY(_lock);
};

}  // namespace orvanta
