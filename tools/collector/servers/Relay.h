#pragma once

#include <atomic>
#include <cstdint>
#include <list>
#include <memory>
#include <string>
#include <thread>

#include "interface/Values.h"
#include "platform/core/Mutex.h"
#include "platform/core/UniqueFd.h"
#include "tools/collector/servers/RelayConnection.h"
#include "tools/collector/wire/Tls.h"

namespace orvanta::collector {

// Listens on one TCP port, plain or TLS, with a thread per connection. Owned by the collector. Clients may connect
// before begin() but wait until then for answers; stop() (or destroying the relay) ends all connections at once and may
// be called on any thread but the relay's own. Connections beyond kMaximumConnections are closed unread.
class Relay {
 public:
  static constexpr std::size_t kMaximumConnections = 512;

  // Port 0 takes any free one; without `tls`, plain. A failure names the port.
  static Result<std::unique_ptr<Relay>> listen(const std::string& address, std::uint16_t port,
                                               std::shared_ptr<TlsServer> tls, RelayContext context);
  ~Relay();
  Relay(const Relay&) = delete;
  Relay& operator=(const Relay&) = delete;

  std::uint16_t port() const { return _port; }
  void begin();
  void stop();

 private:
  struct Connection {
    // Null once it has ended. Set and cleared under the relay's mutex, in between used by `thread`.
    std::unique_ptr<Transport> stream;
    std::thread thread;
    std::atomic<bool> finished{false};
  };
  Relay(platform::UniqueFd listener, std::uint16_t port, std::shared_ptr<TlsServer> tls, RelayContext context);
  void acceptConnections();
  void admit(platform::UniqueFd socket, std::string client);
  void joinFinished();

  // Constant after construction.
  const platform::UniqueFd _listener;
  const std::uint16_t _port;
  const std::shared_ptr<TlsServer> _tls;
  RelayContext _context;
  std::thread _acceptor;
  std::atomic<bool> _stopping{false};

  platform::Mutex _mutex;
  std::list<Connection> _connections GUARDED_BY(_mutex);
};

}  // namespace orvanta::collector
