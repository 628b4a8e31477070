#pragma once

#include <condition_variable>
#include <memory>
#include <mutex>
#include <vector>

#include "config/Platform.h"
#include "daemon/SessionCountStatus.h"
#include "daemon/SessionRegistry.h"
#include "daemon/StorebagCache.h"
#include "interface/Values.h"
#include "platform/listen/Entitlements.h"
#include "platform/listen/Listener.h"
#include "session/OrvantadSession.h"
#include "session/OrvantadSessionDelegate.h"

namespace orvanta {

class SessionConnection;

// The one agent of the process: admits clients, owns their sessions, and holds what sessions share, the storebag cache
// and the registry of related sessions.
//
// Made by main and outlives every session. Admission and invalidation come from connection queues, several at once; the
// delegate operations from any session's queue. The session list's lock and the agent's lock are never held together.
class OrvantadAgent final : public OrvantadSessionDelegate {
 public:
  explicit OrvantadAgent(Platform& platform);
  // `fetch` stands for the storebag server.
  OrvantadAgent(Platform& platform, StorebagCache::Fetch fetch);

  // The listener's handler: whether the peer was admitted. Only peers that hold the entitlement are.
  bool listenerShouldAcceptNewConnection(platform::OfferedConnection&& offered);

  // A client has gone, or the process is about to: takes the session out of every list. On the session's queue; a
  // second call does nothing.
  void invalidated(const std::shared_ptr<OrvantadSession>& session);
  // An admitted session's end() has run. On the session's queue.
  void sessionEnded();
  // An admitted connection has ended: its client has read everything, or had its time. On the connection's queue.
  void connectionEnded();
  // Ends every session while its connection is still open, and returns when all have ended, or after eight seconds:
  // false, with a log line, when the call of one takes longer still. Sessions admitted meanwhile are refused. Not on a
  // pool thread.
  bool endAllSessions();
  // Afterwards: waits until the clients have read what their sessions' ends told them, a second and a half at most.
  void waitForClients();

  std::size_t sessionCount() const;

  AgentLock& lock() override { return _lock; }
  SharedDictionary storebagForSession(OrvantadSession& session) override;
  std::optional<std::string> storebagVersionForSession(OrvantadSession& session) override;
  void updateCorrelatedSessions(const std::shared_ptr<OrvantadSession>& session) override;
  std::optional<std::string> parentSessionIDStringForSession(OrvantadSession& session) override;
  void updateDownstreamSessions(OrvantadSession& session) override;
  std::shared_ptr<OrvantadSession> parentSessionForChild(OrvantadSession& session) override;
  std::shared_ptr<OrvantadSession> getAncestorWithAggregatorForSession(OrvantadSession& session) override;

 private:
  struct Entry {
    std::shared_ptr<OrvantadSession> session;
    std::shared_ptr<SessionConnection> connection;
  };

  void releaseMemoryWhenIdle();  // with _sessionListLock held

  Platform& _platform;
  platform::Entitlements& _entitlements;
  SessionCountStatus _status;

  mutable std::mutex _sessionListLock;
  std::vector<Entry> _sessionList;  // guarded by _sessionListLock; in order of admission
  bool _ending = false;             // guarded by _sessionListLock
  std::size_t _unended = 0;         // guarded by _sessionListLock: admitted, and end() has not run to its end
  std::chrono::steady_clock::time_point _memoryReleased;  // guarded by _sessionListLock
  std::size_t _connected = 0;  // guarded by _sessionListLock: admitted, and connectionEnded() not called
  std::condition_variable _allEnded;

  AgentLock _lock;
  StorebagCache _storebags;   // guarded by _lock
  SessionRegistry _registry;  // guarded by _lock, but for its count of tokens
};

}  // namespace orvanta
