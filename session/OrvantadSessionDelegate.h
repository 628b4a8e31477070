#pragma once

#include <memory>
#include <optional>
#include <string>

#include "interface/Values.h"
#include "session/AgentLock.h"

namespace orvanta {

class OrvantadSession;

// What a session asks of the agent: storebags and the hierarchy of related sessions. Called on any session's queue.
// Outlives every session.
class OrvantadSessionDelegate {
 public:
  virtual ~OrvantadSessionDelegate() = default;

  // Guards the storebag cache, the registry and what sessions read of each other.
  virtual AgentLock& lock() = 0;

  // The backends' profiles for the session's client type, or null. May block for a fetch, holding the lock.
  virtual SharedDictionary storebagForSession(OrvantadSession& session) = 0;
  // Of the cached storebag; never fetches.
  virtual std::optional<std::string> storebagVersionForSession(OrvantadSession& session) = 0;

  // (Re-)registers the session in the group of its hierarchy token; one without a token leaves its earlier group.
  virtual void updateCorrelatedSessions(const std::shared_ptr<OrvantadSession>& session) = 0;
  // The ancestors' identifiers, root first, joined by "."; none for roots and where the direct parent is missing.
  virtual std::optional<std::string> parentSessionIDStringForSession(OrvantadSession& session) = 0;
  // Brings the session's identifiers and states, and those of the deeper sessions of its group, up to date.
  virtual void updateDownstreamSessions(OrvantadSession& session) = 0;

  // The caller holds the lock.
  virtual std::shared_ptr<OrvantadSession> parentSessionForChild(OrvantadSession& session) = 0;
  virtual std::shared_ptr<OrvantadSession> getAncestorWithAggregatorForSession(OrvantadSession& session) = 0;
};

}  // namespace orvanta
