#pragma once

#include <arpa/inet.h>
#include <poll.h>
#include <sys/socket.h>

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <stdexcept>
#include <vector>

#include "platform/core/UniqueFd.h"

namespace orvanta::test {

// A UDP socket on the loopback address that a test receives on and answers from.
class UdpServer {
 public:
  explicit UdpServer(std::uint16_t port = 0) : _fd(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    sockaddr_in address = loopback(port);
    socklen_t length = sizeof address;
    if (::bind(_fd.get(), reinterpret_cast<sockaddr*>(&address), length) != 0 ||
        ::getsockname(_fd.get(), reinterpret_cast<sockaddr*>(&address), &length) != 0) {
      throw std::runtime_error("no UDP port on the loopback address");
    }
    _port = ntohs(address.sin_port);
  }

  std::uint16_t port() const { return _port; }

  // The next datagram, whose sender send() answers from then on; nullopt when nothing comes in time.
  std::optional<std::vector<std::uint8_t>> receive(int timeoutMilliseconds = 30'000) {
    pollfd waiting{_fd.get(), POLLIN, 0};
    if (::poll(&waiting, 1, timeoutMilliseconds) != 1) return std::nullopt;
    std::array<std::uint8_t, 2048> buffer{};
    socklen_t length = sizeof _sender;
    const ssize_t got =
        ::recvfrom(_fd.get(), buffer.data(), buffer.size(), 0, reinterpret_cast<sockaddr*>(&_sender), &length);
    if (got < 0) return std::nullopt;
    return std::vector<std::uint8_t>(buffer.begin(), buffer.begin() + got);
  }
  void send(std::span<const std::uint8_t> datagram) { sendTo(_sender, datagram); }
  void sendTo(const sockaddr_in& receiver, std::span<const std::uint8_t> datagram) {
    ::sendto(_fd.get(), datagram.data(), datagram.size(), 0, reinterpret_cast<const sockaddr*>(&receiver),
             sizeof receiver);
  }
  const sockaddr_in& sender() const { return _sender; }

 private:
  static sockaddr_in loopback(std::uint16_t port) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    return address;
  }

  platform::UniqueFd _fd;
  std::uint16_t _port = 0;
  sockaddr_in _sender{};
};

}  // namespace orvanta::test
