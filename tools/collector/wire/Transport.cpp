#include "tools/collector/wire/Transport.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <cerrno>
#include <string>

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

void prepareStreamSocket(int descriptor) {
  const int on = 1;
  ::setsockopt(descriptor, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
  const timeval patience{kStreamPatience.count(), 0};
  ::setsockopt(descriptor, SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  ::setsockopt(descriptor, SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
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
