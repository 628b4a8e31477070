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

// An IPv4 socket of that type (SOCK_STREAM or SOCK_DGRAM) bound to the address; port 0 takes any free one.
Result<BoundSocket> bindSocket(int type, const std::string& address, std::uint16_t port);

// "127.0.0.1:4711".
std::string addressText(const sockaddr_in& address);

// How long a peer may take for one read or write before its connection is given up.
inline constexpr std::chrono::seconds kStreamTimeout{120};
void prepareStreamSocket(int descriptor);

// One connected stream, plain or TLS, for a thread that reads and writes in turn. Another thread may call interrupt(),
// after which everything ends as if the peer had gone.
class Transport {
 public:
  explicit Transport(platform::UniqueFd socket) : _socket(std::move(socket)) {}
  virtual ~Transport() = default;
  Transport(const Transport&) = delete;
  Transport& operator=(const Transport&) = delete;

  static std::unique_ptr<Transport> plain(platform::UniqueFd socket);
  // A connection to that port of this machine; null when nobody listens there.
  static std::unique_ptr<Transport> connectLoopback(std::uint16_t port);

  // Bytes read; 0 when the peer has ended its side, the stream has failed or nothing came in time.
  virtual std::size_t read(char* buffer, std::size_t size) = 0;
  // False when the stream has failed.
  virtual bool write(std::string_view bytes) = 0;
  // Tells the peer that nothing more follows.
  virtual void finish() = 0;

  // Both wake-ups end together: the peer has closed, or (with a limit) the time is over. True: the peer has closed.
  bool waitForPeerToClose(std::optional<std::chrono::milliseconds> limit) const;
  // Whether something waits to be read, an end included.
  bool readable() const;
  // The peer sees the connection reset. Nothing may follow.
  void reset();
  // Any thread.
  void interrupt() const;

 protected:
  int descriptor() const { return _socket.get(); }

 private:
  platform::UniqueFd _socket;
};

}  // namespace orvanta::collector
