#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "platform/core/Result.h"
#include "platform/ipc/Connection.h"
#include "platform/listen/PeerIdentity.h"
#include "platform/listen/ServiceSocket.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

// A peer that has connected, offered to the listener's delegate.
struct OfferedConnection {
  std::shared_ptr<Connection> connection;  // not resumed yet; its description is set
  PeerIdentity peer;
};

struct ListenerLimits {
  ConnectionLimits connection;         // of each accepted one
  std::size_t connectionsPerUser = 0;  // at a time; further ones of that uid are closed at once, with a log line
};

// Listens on a named service: a Unix stream socket in the runtime directory, or the one that systemd passed.
//
// The handler runs on the pool, possibly on several threads at once. It returns whether it admitted (and resumed) the
// connection; a refused one is closed. When descriptors run out (EMFILE) accepting pauses for 100 ms instead of
// spinning, with one log line a minute.
class Listener {
 public:
  using Handler = std::function<bool(OfferedConnection&&)>;

  // Takes LISTEN_FDS's socket if systemd passed one, else binds `directory`/`service`. A stale socket file is replaced;
  // a live one fails with a text that says which process listens there.
  static Result<std::unique_ptr<Listener>> create(WorkPool& pool, const std::string& directory,
                                                  const std::string& service, const ListenerLimits& limits,
                                                  Handler handler);
  // On a socket that was made before, so that its making can come first of all.
  static std::unique_ptr<Listener> create(WorkPool& pool, ServiceSocket socket, const ListenerLimits& limits,
                                          Handler handler);
  virtual ~Listener() = default;
  virtual void resume() = 0;
  // Accepts no more and removes the socket file that create() made. Returns true once no handler runs any more, false
  // when one still did after kStopTimeout, as one that waits for something that never comes does; that one is left
  // alone, and the destructor waits for it without limit. Not from a handler.
  virtual bool stop() = 0;
  static constexpr std::chrono::seconds kStopTimeout{2};
};

}  // namespace orvanta::platform
