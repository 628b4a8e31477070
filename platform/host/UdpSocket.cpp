#include "platform/host/UdpSocket.h"

#include <sys/socket.h>

#include <cerrno>

namespace orvanta::platform {

namespace {

int bindOrConnect(int (*call)(int, const sockaddr*, socklen_t), int fd, const sockaddr_in& address) {
  return call(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 ? 0 : errno;
}

}  // namespace

int UdpSocket::open() {
  _fd.reset(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  return _fd ? 0 : errno;
}

int UdpSocket::bindAnyPort() {
  sockaddr_in any{};
  any.sin_family = AF_INET;
  any.sin_addr.s_addr = htonl(INADDR_ANY);
  return bindOrConnect(&::bind, _fd.get(), any);
}

int UdpSocket::connect(const sockaddr_in& server) {
  return bindOrConnect(&::connect, _fd.get(), server);
}

bool UdpSocket::send(std::span<const std::uint8_t> datagram) {
  ssize_t sent = 0;
  do {
    sent = ::send(_fd.get(), datagram.data(), datagram.size(), MSG_NOSIGNAL);
  } while (sent < 0 && errno == EINTR);
  return sent >= 0 && static_cast<std::size_t>(sent) == datagram.size();
}

std::optional<std::size_t> UdpSocket::receive(std::span<std::uint8_t> buffer) {
  ssize_t received = 0;
  do {
    received = ::recv(_fd.get(), buffer.data(), buffer.size(), 0);
  } while (received < 0 && errno == EINTR);
  if (received < 0) return std::nullopt;
  return static_cast<std::size_t>(received);
}

}  // namespace orvanta::platform
