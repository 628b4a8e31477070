#pragma once

#include <memory>
#include <optional>
#include <string>

#include "interface/Values.h"
#include "platform/core/Mutex.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta {

class OrvantadSession;

// The agent's recursive lock. It is held across a storebag fetch, so a thread that has to wait for it does so in a
// BlockingScope: waiting sessions never starve others of threads. Meets the standard's Lockable requirements.
class CAPABILITY("mutex") AgentLock {
 public:
  void lock() ACQUIRE() NO_THREAD_SAFETY_ANALYSIS {
    if (_mutex.try_lock()) return;
    const platform::BlockingScope blocking;
    _mutex.lock();
  }
  bool try_lock() TRY_ACQUIRE(true) { return _mutex.try_lock(); }
  void unlock() RELEASE() { _mutex.unlock(); }

  // Holds the lock from here to the end of the block.
  class SCOPED_CAPABILITY Held {
   public:
    explicit Held(AgentLock& lock) ACQUIRE(lock) : _lock(lock) { _lock.lock(); }
    Held(const Held&) = delete;
    Held& operator=(const Held&) = delete;
    ~Held() RELEASE() { _lock.unlock(); }

   private:
    AgentLock& _lock;
  };

 private:
  platform::RecursiveMutex _mutex;
};

// The agent as its sessions see it: storebags and the hierarchy of related sessions. Called on any session's queue.
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
  // The ancestors' identifiers, root first, joined by "."; nullopt for roots and where the direct parent is missing.
  virtual std::optional<std::string> parentSessionIDStringForSession(OrvantadSession& session) = 0;
  // Brings the session's identifiers and states, and those of the deeper sessions of its group, up to date.
  virtual void updateDownstreamSessions(OrvantadSession& session) = 0;

  virtual std::shared_ptr<OrvantadSession> parentSessionForChild(OrvantadSession& session) REQUIRES(lock()) = 0;
  virtual std::shared_ptr<OrvantadSession> getAncestorWithAggregatorForSession(OrvantadSession& session)
      REQUIRES(lock()) = 0;
};

}  // namespace orvanta
