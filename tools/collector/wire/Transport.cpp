#include "tools/collector/wire/Transport.h"

#include <arpa/inet.h>
#include <fmt/format.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <array>
#include <cerrno>

#include "platform/core/Text.h"

namespace orvanta::collector {

namespace {

class PlainTransport final : public Transport {
 public:
  using Transport::Transport;

  std::size_t read(char* buffer, std::size_t size) override {
    ssize_t count = 0;
    do count = ::recv(descriptor(), buffer, size, 0);
    while (count < 0 && errno == EINTR);
    return count > 0 ? static_cast<std::size_t>(count) : 0;
  }
  bool write(std::string_view bytes) override {
    while (!bytes.empty()) {
      const ssize_t count = ::send(descriptor(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
      if (count < 0 && errno == EINTR) continue;
      if (count <= 0) return false;
      bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
  }
  void finish() override { ::shutdown(descriptor(), SHUT_WR); }
};

}  // namespace

Result<BoundSocket> bindSocket(int type, const std::string& address, std::uint16_t port) {
  sockaddr_in wanted{};
  wanted.sin_family = AF_INET;
  wanted.sin_port = htons(port);
  if (::inet_pton(AF_INET, address.c_str(), &wanted.sin_addr) != 1) return Failure{"not an IPv4 address: " + address};
  platform::UniqueFd socket(::socket(AF_INET, type | SOCK_CLOEXEC, 0));
  const int on = 1;
  // A port whose last connections still linger may be used again at once.
  if (type == SOCK_STREAM && socket) ::setsockopt(socket.get(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
  if (!socket || ::bind(socket.get(), reinterpret_cast<sockaddr*>(&wanted), sizeof wanted) != 0) {
    return Failure{fmt::format("cannot use {} port {} of {}: {}", type == SOCK_STREAM ? "TCP" : "UDP", port, address,
                               platform::errnoText(errno))};
  }
  sockaddr_in bound{};
  socklen_t size = sizeof bound;
  if (::getsockname(socket.get(), reinterpret_cast<sockaddr*>(&bound), &size) != 0) {
    return Failure{fmt::format("cannot tell the port: {}", platform::errnoText(errno))};
  }
  return BoundSocket{std::move(socket), ntohs(bound.sin_port)};
}

std::string addressText(const sockaddr_in& address) {
  std::array<char, INET_ADDRSTRLEN> text{};
  ::inet_ntop(AF_INET, &address.sin_addr, text.data(), text.size());
  return fmt::format("{}:{}", text.data(), ntohs(address.sin_port));
}

void prepareStreamSocket(int descriptor) {
  const int on = 1;
  ::setsockopt(descriptor, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
  const timeval timeout{kStreamTimeout.count(), 0};
  ::setsockopt(descriptor, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
  ::setsockopt(descriptor, SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof timeout);
}

std::unique_ptr<Transport> Transport::plain(platform::UniqueFd socket) {
  return std::make_unique<PlainTransport>(std::move(socket));
}

std::unique_ptr<Transport> Transport::connectLoopback(std::uint16_t port) {
  platform::UniqueFd socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(port);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  if (!socket || ::connect(socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) return nullptr;
  prepareStreamSocket(socket.get());
  return plain(std::move(socket));
}

bool Transport::waitForPeerToClose(std::optional<std::chrono::milliseconds> limit) const {
  using Clock = std::chrono::steady_clock;
  const auto end = Clock::now() + limit.value_or(std::chrono::milliseconds(0));
  while (true) {
    int timeout = -1;
    if (limit) {
      const auto left = std::chrono::ceil<std::chrono::milliseconds>(end - Clock::now());
      if (left.count() <= 0) return false;
      timeout = static_cast<int>(left.count());
    }
    pollfd waiting{_socket.get(), POLLRDHUP, 0};
    const int count = ::poll(&waiting, 1, timeout);
    if (count > 0) return true;
    if (count < 0 && errno != EINTR) return true;
  }
}

bool Transport::readable() const {
  pollfd waiting{_socket.get(), POLLIN | POLLRDHUP, 0};
  return ::poll(&waiting, 1, 0) > 0;
}

void Transport::reset() {
  const linger atOnce{1, 0};
  ::setsockopt(_socket.get(), SOL_SOCKET, SO_LINGER, &atOnce, sizeof atOnce);
}

void Transport::interrupt() const {
  ::shutdown(_socket.get(), SHUT_RDWR);
}

}  // namespace orvanta::collector
