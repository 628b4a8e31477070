#include "platform/listen/ServiceListener.h"

#include <fmt/format.h>
#include <sys/socket.h>

#include <cassert>
#include <cerrno>
#include <unordered_map>
#include <utility>

#include "platform/core/Log.h"
#include "platform/core/Text.h"
#include "platform/ipc/SocketConnection.h"

namespace orvanta::platform {

namespace {

constexpr int kAcceptsPerTurn = 16;
constexpr std::chrono::milliseconds kPause{100};
constexpr std::chrono::minutes kLogInterval{1};

// Returns whether a line that could come at any rate is due again.
bool isDue(std::optional<std::chrono::steady_clock::time_point>& logged) {
  const auto now = std::chrono::steady_clock::now();
  if (logged && now - *logged < kLogInterval) return false;
  logged = now;
  return true;
}

}  // namespace

Result<std::unique_ptr<Listener>> Listener::create(WorkPool& pool, const std::string& directory,
                                                   const std::string& service, const ListenerLimits& limits,
                                                   Handler handler) {
  auto socket = openServiceSocket(directory, service);
  if (!socket) return Failure{socket.error()};
  return create(pool, std::move(*socket), limits, std::move(handler));
}

std::unique_ptr<Listener> Listener::create(WorkPool& pool, ServiceSocket socket, const ListenerLimits& limits,
                                           Handler handler) {
  return std::make_unique<ServiceListener>(pool, std::move(socket), limits, std::move(handler));
}

struct ConnectionQuota::Counts {
  Mutex mutex;
  std::unordered_map<uid_t, std::size_t> perUser GUARDED_BY(mutex);  // no zeros

  void release(uid_t user) {
    const MutexLock lock(mutex);
    const auto place = perUser.find(user);
    if (--place->second == 0) perUser.erase(place);
  }
};

ConnectionQuota::ConnectionQuota(std::size_t maximumPerUser)
    : _maximum(maximumPerUser), _counts(std::make_shared<Counts>()) {}

std::shared_ptr<void> ConnectionQuota::take(uid_t user) {
  {
    const MutexLock lock(_counts->mutex);
    std::size_t& count = _counts->perUser[user];
    if (count >= _maximum) return nullptr;
    ++count;
  }
  return {_counts.get(), [counts = _counts, user](void*) { counts->release(user); }};
}

Acceptor::Acceptor(WorkPool& pool, ServiceSocket socket, const ListenerLimits& limits, Listener::Handler handler)
    : _pool(pool),
      _handler(std::move(handler)),
      _limits(limits),
      _queue(pool.makeQueue()),
      _socket(std::move(socket)),
      _quota(limits.connectionsPerUser) {}

void Acceptor::start() {
  _queue->post([self = shared_from_this()] { self->acceptSome(); });
}

void Acceptor::acceptSome() {
  assert(_queue->isCurrent());
  if (_closed) return;
  if (!_watch) _watch = _queue->makeDescriptorWatch(_socket.socket.get());
  if (!_watch) return pause(ENOSPC);  // the limit of watched descriptors
  for (int i = 0; i < kAcceptsPerTurn; ++i) {
    if (!acceptOne()) return;
  }
  start();  // others first
}

// Returns false when there is nothing more to accept for now; the next attempt has then been arranged.
bool Acceptor::acceptOne() {
  UniqueFd socket(::accept4(_socket.socket.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
  if (socket) {
    admit(std::move(socket));
    return true;
  }
  switch (errno) {
    case EINTR:
    case ECONNABORTED:
      return true;
    case EAGAIN:
      _watch->whenReadable([self = shared_from_this()] { self->acceptSome(); });
      return false;
    default:
      pause(errno);
      return false;
  }
}

void Acceptor::pause(int error) {
  if (isDue(_pauseLogged)) {
    PLATFORM_LOG(error, "Listener: No connection can be accepted, trying again every {} ms: {}", kPause.count(),
                 errnoText(error));
  }
  if (!_timer) _timer = _queue->makeTimer();
  _timer->runAfter(kPause, [self = shared_from_this()] { self->acceptSome(); });
}

void Acceptor::admit(UniqueFd socket) {
  auto peer = peerIdentityOf(socket.get());
  if (!peer) {
    PLATFORM_LOG(warning, "Listener: A connection was closed: {}", peer.error());
    return;
  }
  auto place = _quota.take(peer->uid);
  if (!place) {
    if (isDue(_refusalLogged)) {
      PLATFORM_LOG(warning, "Listener: A connection was closed: User {} has {} already", peer->uid,
                   _limits.connectionsPerUser);
    }
    return;
  }
  _pool.post(
      [self = shared_from_this(), socket = std::move(socket), peer = std::move(*peer),
       place = std::move(place)]() mutable { self->offer(std::move(socket), std::move(peer), std::move(place)); });
}

void Acceptor::offer(UniqueFd socket, PeerIdentity peer, std::shared_ptr<void> place) {
  {
    const MutexLock lock(_mutex);
    if (_stopped) return;
    ++_offering;
  }
  const int fd = socket.get();
  const auto connection = SocketConnection::create(_pool, std::move(socket), _limits.connection);
  connection->setDescription(fmt::format("fd {} (pid {}, uid {})", fd, peer.pid, peer.uid));
  connection->hold(std::move(place));
  if (!_handler({connection, std::move(peer)})) connection->cancel(std::chrono::milliseconds(0));

  const MutexLock lock(_mutex);
  --_offering;
  _idle.notifyAll();
}

bool Acceptor::stop(std::optional<std::chrono::seconds> limit) {
  {
    const MutexLock lock(_mutex);
    if (!_stopped) {
      _stopped = true;
      _socket.removeFile();
      _queue->post([self = shared_from_this()] { self->close(); });
    }
  }
  MutexLock lock(_mutex);
  if (_offering == 0) return true;
  lock.unlock();
  const BlockingScope blocking;
  lock.lock();
  if (!limit) {
    while (_offering > 0) _idle.wait(lock);
    return true;
  }
  const auto deadline = std::chrono::steady_clock::now() + *limit;
  while (_offering > 0 && _idle.waitUntil(lock, deadline)) {
  }
  return _offering == 0;
}

void Acceptor::close() {
  assert(_queue->isCurrent());
  _closed = true;
  _watch.reset();
  _timer.reset();
  _socket.socket.reset();
}

}  // namespace orvanta::platform
