#include "tools/collector/servers/Relay.h"

#include <arpa/inet.h>
#include <fmt/format.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <utility>

#include "platform/core/Text.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {
using platform::UniqueFd;

namespace {

// A peer that closes the connection while OpenSSL writes must not end the process.
void blockBrokenPipeSignal() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGPIPE);
  ::pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

}  // namespace

Result<std::unique_ptr<Relay>> Relay::listen(const std::string& address, std::uint16_t port,
                                             std::shared_ptr<TlsServer> tls, RelayContext context) {
  auto bound = bindSocket(SOCK_STREAM, address, port);
  if (!bound) return Failure{bound.error()};
  if (::listen(bound->socket.get(), SOMAXCONN) != 0) {
    return Failure{fmt::format("cannot listen on port {}: {}", bound->port, platform::errnoText(errno))};
  }
  return std::unique_ptr<Relay>(new Relay(std::move(bound->socket), bound->port, std::move(tls), std::move(context)));
}

Relay::Relay(UniqueFd listener, std::uint16_t port, std::shared_ptr<TlsServer> tls, RelayContext context)
    : _listener(std::move(listener)), _port(port), _tls(std::move(tls)), _context(std::move(context)) {}

void Relay::begin() {
  _acceptor = std::thread([this] { acceptConnections(); });
}

Relay::~Relay() {
  stop();
}

void Relay::stop() {
  if (_stopping.exchange(true)) return;
  ::shutdown(_listener.get(), SHUT_RDWR);
  if (_acceptor.joinable()) _acceptor.join();
  std::list<Connection> ending;
  {
    const platform::MutexLock lock(_mutex);
    for (const Connection& connection : _connections) {
      if (connection.stream) connection.stream->interrupt();
    }
    ending.swap(_connections);
  }
  // Without the lock, which each thread takes once more at its end.
  for (Connection& connection : ending) connection.thread.join();
}

void Relay::acceptConnections() {
  while (!_stopping) {
    sockaddr_in peer{};
    socklen_t size = sizeof peer;
    UniqueFd socket(::accept4(_listener.get(), reinterpret_cast<sockaddr*>(&peer), &size, SOCK_CLOEXEC));
    joinFinished();
    if (socket) {
      admit(std::move(socket), addressText(peer));
    } else if (errno == EMFILE || errno == ENFILE || errno == ENOBUFS || errno == ENOMEM) {
      // Connections have to end before another can be taken; the waiting one would be announced without pause.
      ::poll(nullptr, 0, 50);
    } else if (errno != EINTR && errno != ECONNABORTED && !_stopping) {
      return;
    }
  }
}

void Relay::admit(UniqueFd socket, std::string client) {
  prepareStreamSocket(socket.get());
  const platform::MutexLock lock(_mutex);
  if (_connections.size() >= kMaximumConnections) return;
  Connection& connection = _connections.emplace_back();
  connection.stream = _tls ? _tls->accept(std::move(socket)) : Transport::plain(std::move(socket));
  connection.thread = std::thread([this, &connection, client = std::move(client)] {
    blockBrokenPipeSignal();
    RelayConnection(*connection.stream, _context, client, _tls != nullptr).run();
    {
      // Closed here, not when the thread is joined: the client waits for it.
      const platform::MutexLock lock(_mutex);
      connection.stream.reset();
    }
    connection.finished = true;
  });
}

void Relay::joinFinished() {
  const platform::MutexLock lock(_mutex);
  for (auto it = _connections.begin(); it != _connections.end();) {
    if (!it->finished) {
      ++it;
      continue;
    }
    it->thread.join();
    it = _connections.erase(it);
  }
}

}  // namespace orvanta::collector
