#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>

#include "platform/core/Mutex.h"
#include "platform/listen/Listener.h"
#include "platform/listen/ServiceSocket.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

// How many connections each user has. Thread-safe; places may outlive it.
class ConnectionQuota {
 public:
  explicit ConnectionQuota(std::size_t maximumPerUser);
  // A place for one connection, given back when the last copy goes; null when the user has no place left.
  std::shared_ptr<void> take(uid_t user);

 private:
  struct Counts;
  const std::size_t _maximum;
  const std::shared_ptr<Counts> _counts;
};

// The work of a ServiceListener, apart from it so that what is under way can outlive it. Accepts on a queue of its own,
// offers on any thread of the pool.
class Acceptor final : public std::enable_shared_from_this<Acceptor> {
 public:
  Acceptor(WorkPool& pool, ServiceSocket socket, const ListenerLimits& limits, Listener::Handler handler);

  void start();
  // Waits for the handlers under way, at most for `limit` if it is given. Returns whether all have ended.
  bool stop(std::optional<std::chrono::seconds> limit);

 private:
  using Instant = std::chrono::steady_clock::time_point;

  // On _queue.
  void acceptSome();
  bool acceptOne();
  void admit(UniqueFd socket);
  void pause(int error);
  void close();

  // On any thread of the pool.
  void offer(UniqueFd socket, PeerIdentity peer, std::shared_ptr<void> place);

  // Constant after construction.
  WorkPool& _pool;
  const Listener::Handler _handler;
  const ListenerLimits _limits;
  const std::shared_ptr<WorkQueue> _queue;

  // Owned by _queue.
  ServiceSocket _socket;  // stop() removes its file, which the queue never touches
  ConnectionQuota _quota;
  std::unique_ptr<DescriptorWatch> _watch;
  std::unique_ptr<Timer> _timer;
  bool _closed = false;
  std::optional<Instant> _pauseLogged;
  std::optional<Instant> _refusalLogged;

  Mutex _mutex;
  Condition _idle;
  bool _stopped GUARDED_BY(_mutex) = false;
  std::size_t _offering GUARDED_BY(_mutex) = 0;  // handlers under way
};

// The Listener on a service socket.
class ServiceListener final : public Listener {
 public:
  ServiceListener(WorkPool& pool, ServiceSocket socket, const ListenerLimits& limits, Handler handler)
      : _acceptor(std::make_shared<Acceptor>(pool, std::move(socket), limits, std::move(handler))) {}
  ~ServiceListener() override { _acceptor->stop(std::nullopt); }

  void resume() override { _acceptor->start(); }
  bool stop() override { return _acceptor->stop(kStopTimeout); }

 private:
  const std::shared_ptr<Acceptor> _acceptor;
};

}  // namespace orvanta::platform
