#pragma once

#include <atomic>
#include <cstdint>
#include <list>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "interface/Values.h"
#include "platform/core/UniqueFd.h"
#include "tools/collector/servers/RelayConnection.h"
#include "tools/collector/wire/Tls.h"

namespace orvanta::collector {

// Listens on one TCP port, plain or TLS, with a thread per connection. Connections wait until begin(); stop() (or
// destruction) ends them all at once and may be called on any thread but the relay's own.
class Relay {
 public:
  static constexpr std::size_t kMaximumConnections = 512;

  // Port 0 takes any free one. `tls` null: plain.
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
    std::unique_ptr<Transport> stream;  // null once it has ended; set and cleared under the mutex
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

  std::mutex _mutex;
  std::list<Connection> _connections;  // guarded by _mutex; a connection's stream is used by its thread
};

}  // namespace orvanta::collector
