#include "tools/collector/wire/Sockets.h"

#include <arpa/inet.h>
#include <fmt/format.h>
#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <utility>

namespace orvanta::collector {

Result<BoundSocket> bindSocket(int type, const std::string& address, std::uint16_t port) {
  sockaddr_in wanted{};
  wanted.sin_family = AF_INET;
  wanted.sin_port = htons(port);
  if (::inet_pton(AF_INET, address.c_str(), &wanted.sin_addr) != 1) return Failure{"no IPv4 address: " + address};
  platform::UniqueFd socket(::socket(AF_INET, type | SOCK_CLOEXEC, 0));
  const int on = 1;
  // A port whose last connections still linger may be used again at once.
  if (type == SOCK_STREAM && socket) ::setsockopt(socket.get(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
  if (!socket || ::bind(socket.get(), reinterpret_cast<sockaddr*>(&wanted), sizeof wanted) != 0) {
    return Failure{fmt::format("cannot use {} port {} of {}: {}", type == SOCK_STREAM ? "TCP" : "UDP", port, address,
                               std::strerror(errno))};
  }
  sockaddr_in bound{};
  socklen_t size = sizeof bound;
  if (::getsockname(socket.get(), reinterpret_cast<sockaddr*>(&bound), &size) != 0) {
    return Failure{fmt::format("cannot tell the port: {}", std::strerror(errno))};
  }
  return BoundSocket{std::move(socket), ntohs(bound.sin_port)};
}

std::string addressText(const sockaddr_in& address) {
  std::array<char, INET_ADDRSTRLEN> text{};
  ::inet_ntop(AF_INET, &address.sin_addr, text.data(), text.size());
  return fmt::format("{}:{}", text.data(), ntohs(address.sin_port));
}

}  // namespace orvanta::collector
