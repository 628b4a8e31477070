#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <vector>

#include "config/Platform.h"
#include "platform/core/Mutex.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta {

class OrvantadSession;
class SessionConnection;

// Keeps the service manager's status text at the number of sessions. Reports a little later than the number changes,
// and then only the latest: clients that come and go must not keep the service manager busy. Any thread.
class SessionCountStatus {
 public:
  explicit SessionCountStatus(platform::WorkPool& pool);

  void changed(std::size_t count);

 private:
  struct State;
  const std::shared_ptr<State> _state;  // shared with what waits on the queue
};

// The sessions of admitted connections in order of admission, and how far each has come:
//
//   open ──its client leaves, or the daemon ends──► ending ──end() has run──► ended ──connection ended──► removed
//
// Only open ones count as sessions: the process is marked busy while there is one. The list owns them until then; later
// their connections do. Nothing is destroyed under the lock. It is never held together with the agent's; the locks of
// the status and of the keep-alive are taken inside it.
//
// Owned by the agent; any thread.
class SessionList {
 public:
  explicit SessionList(Platform& platform);

  // Returns false, and keeps nothing, once endAll() has begun.
  bool admit(const OrvantadSession& session, std::shared_ptr<SessionConnection> connection);
  // Open to ending. Does nothing for a session that is not open here.
  void leave(const OrvantadSession& session);
  // Ending to ended: its end() has run.
  void ended(const OrvantadSession& session);
  // Ended to removed: its client has read everything, or had its time.
  void connectionEnded(const OrvantadSession& session);

  std::size_t openCount() const;

  // Ends every open session while its connection can still carry answers, and returns when all have ended. Returns
  // false, with a log line, when that takes longer than eight seconds. admit() refuses from now on. Not on a pool
  // thread.
  bool endAll();
  // Afterwards: waits until the clients have read how their sessions ended, a second and a half at most.
  void waitForClients();

 private:
  enum class State { open, ending, ended };
  struct Entry {
    const OrvantadSession* session;
    std::shared_ptr<SessionConnection> connection;  // owns the session; null unless open
    State state = State::open;
  };

  std::vector<Entry>::iterator find(const OrvantadSession& session) REQUIRES(_lock);
  void releaseMemoryWhenIdle() REQUIRES(_lock);

  Platform& _platform;
  SessionCountStatus _status;

  mutable platform::Mutex _lock;
  platform::Condition _changed;
  std::vector<Entry> _entries GUARDED_BY(_lock);
  std::size_t _open GUARDED_BY(_lock) = 0;     // of the entries: those in state open
  std::size_t _unended GUARDED_BY(_lock) = 0;  // those in state open or ending
  bool _isEnding GUARDED_BY(_lock) = false;
  std::chrono::steady_clock::time_point _memoryReleased GUARDED_BY(_lock);
};

}  // namespace orvanta
