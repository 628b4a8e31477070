#pragma once

#include <netinet/in.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "interface/Values.h"
#include "platform/core/UniqueFd.h"

namespace orvanta::collector {

struct BoundSocket {
  platform::UniqueFd socket;
  std::uint16_t port = 0;
};

// Binds an IPv4 socket of that type (SOCK_STREAM or SOCK_DGRAM); port 0 takes any free one. The failure names
// address and port.
Result<BoundSocket> bindSocket(int type, const std::string& address, std::uint16_t port);

// "127.0.0.1:4711".
std::string addressText(const sockaddr_in& address);

// How long a peer may take for one read or write before its connection is given up.
inline constexpr std::chrono::seconds kStreamTimeout{120};
// Sets that timeout, and sends without delay.
void prepareStreamSocket(int descriptor);

// One connected stream, plain or TLS, owned and used by one thread, which reads and writes in turn. Another thread may
// call interrupt(), after which every call returns as if the peer had closed the connection.
class Transport {
 public:
  explicit Transport(platform::UniqueFd socket) : _socket(std::move(socket)) {}
  virtual ~Transport() = default;
  Transport(const Transport&) = delete;
  Transport& operator=(const Transport&) = delete;

  static std::unique_ptr<Transport> plain(platform::UniqueFd socket);
  // Connects to that port of this machine; null if no process listens there.
  static std::unique_ptr<Transport> connectLoopback(std::uint16_t port);

  // Returns the number of bytes read; 0 if the peer has closed its side, the stream has failed or the timeout is over.
  virtual std::size_t read(char* buffer, std::size_t size) = 0;
  // Returns false if the stream has failed.
  virtual bool write(std::string_view bytes) = 0;
  // Tells the peer that nothing more follows.
  virtual void finish() = 0;

  // Waits, with a limit no longer than that. Returns whether the peer has closed the connection; if not,
  // the time is over.
  bool waitForPeerToClose(std::optional<std::chrono::milliseconds> limit) const;
  // Returns whether a read would return at once, with bytes or the end of the stream.
  bool readable() const;
  // Makes the peer see a reset connection when this object is destroyed. No other call may follow.
  void reset();
  // Any thread.
  void interrupt() const;

 protected:
  int descriptor() const { return _socket.get(); }

 private:
  platform::UniqueFd _socket;
};

}  // namespace orvanta::collector
