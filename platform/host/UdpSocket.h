#pragma once

#include <netinet/in.h>

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

#include "platform/core/UniqueFd.h"

namespace orvanta::platform {

// An IPv4 UDP socket that never blocks. Owned and used by one thread or queue at a time. Functions that
// return an int return the system's error number; 0 is success.
class UdpSocket {
 public:
  int open();
  // Any local address, a port that the system chooses.
  int bindAnyPort();
  // From then on datagrams go to that address only, and only ones from it arrive.
  int connect(const sockaddr_in& server);
  // Returns whether the whole datagram went out.
  bool send(std::span<const std::uint8_t> datagram);
  // The length of one datagram put into `buffer`, which may be 0; nullopt when nothing waits, or on an error.
  std::optional<std::size_t> receive(std::span<std::uint8_t> buffer);
  void close() { _fd.reset(); }

  bool isOpen() const { return static_cast<bool>(_fd); }
  int descriptor() const { return _fd.get(); }

 private:
  UniqueFd _fd;
};

}  // namespace orvanta::platform
