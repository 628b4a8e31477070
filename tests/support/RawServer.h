#pragma once

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <list>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/core/UniqueFd.h"

namespace orvanta::test {

// One accepted connection of a RawServer, in the hands of the script that runs for it.
class RawConnection {
 public:
  RawConnection(int fd, std::function<void(std::string)> remember) : _fd(fd), _remember(std::move(remember)) {}

  // The next whole request, headers and the body of their Content-Length, as it came; nullopt when the client closed
  // before. The server remembers it.
  std::optional<std::string> readRequest() {
    std::size_t end = 0;
    while ((end = _pending.find("\r\n\r\n")) == std::string::npos) {
      if (!readMore()) return std::nullopt;
    }
    const std::size_t size = end + 4 + contentLength(_pending.substr(0, end));
    while (_pending.size() < size) {
      if (!readMore()) return std::nullopt;
    }
    std::string request = _pending.substr(0, size);
    _pending.erase(0, size);
    _remember(request);
    return request;
  }
  // False when the client is gone.
  bool write(std::string_view bytes) {
    while (!bytes.empty()) {
      const ssize_t count = ::send(_fd, bytes.data(), bytes.size(), MSG_NOSIGNAL);
      if (count <= 0) return false;
      bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
  }
  // Ends the connection with a reset instead of a close.
  void reset() {
    const linger abrupt{1, 0};
    ::setsockopt(_fd, SOL_SOCKET, SO_LINGER, &abrupt, sizeof abrupt);
  }
  // Until the client closes, or the server stops. Bytes that come meanwhile are thrown away.
  void waitForClose() {
    while (readMore()) _pending.clear();
  }

 private:
  static std::size_t contentLength(std::string headers) {
    std::transform(headers.begin(), headers.end(), headers.begin(), [](unsigned char c) { return std::tolower(c); });
    const std::size_t at = headers.find("\r\ncontent-length:");
    return at == std::string::npos ? 0 : std::stoul(headers.substr(at + 17));
  }
  bool readMore() {
    std::array<char, 65536> buffer;
    const ssize_t count = ::recv(_fd, buffer.data(), buffer.size(), 0);
    if (count <= 0) return false;
    _pending.append(buffer.data(), static_cast<std::size_t>(count));
    return true;
  }

  const int _fd;
  const std::function<void(std::string)> _remember;
  std::string _pending;
};

// A TCP server on the loopback interface that does exactly what a script says, wrong things too. The script runs on a
// thread of its own for each connection, which is closed when the script returns.
class RawServer {
 public:
  using Script = std::function<void(RawConnection&)>;

  explicit RawServer(Script script) : _script(std::move(script)) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t length = sizeof address;
    if (::bind(_listener.get(), reinterpret_cast<sockaddr*>(&address), length) != 0 ||
        ::listen(_listener.get(), 128) != 0 ||
        ::getsockname(_listener.get(), reinterpret_cast<sockaddr*>(&address), &length) != 0) {
      throw std::runtime_error("no port for a test server");
    }
    _port = ntohs(address.sin_port);
    _acceptor = std::thread([this] { acceptAll(); });
  }
  // Ends all connections, then waits for the scripts.
  ~RawServer() {
    {
      const std::lock_guard lock(_mutex);
      _stopping = true;
      for (const int fd : _open) ::shutdown(fd, SHUT_RDWR);
    }
    ::shutdown(_listener.get(), SHUT_RDWR);
    _acceptor.join();
    for (std::thread& script : _scripts) script.join();
  }
  RawServer(const RawServer&) = delete;
  RawServer& operator=(const RawServer&) = delete;

  int port() const { return _port; }
  std::string url(std::string_view path = "/") const {
    return "http://127.0.0.1:" + std::to_string(_port) + std::string(path);
  }
  // Requests read so far, in the order in which they were complete.
  std::vector<std::string> requests() const {
    const std::lock_guard lock(_mutex);
    return _requests;
  }
  std::size_t connectionCount() const {
    const std::lock_guard lock(_mutex);
    return _scripts.size();
  }
  // False when they have not come within half a minute.
  bool waitForRequests(std::size_t count) const {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, std::chrono::seconds(30), [&] { return _requests.size() >= count; });
  }

  // A script that answers every request of a connection alike.
  static Script answering(std::string answer) {
    return [answer = std::move(answer)](RawConnection& connection) {
      while (connection.readRequest() && connection.write(answer)) continue;
    };
  }
  static std::string response(std::string_view statusLine, std::string_view headers = {}, std::string_view body = {}) {
    return "HTTP/1.1 " + std::string(statusLine) + "\r\n" + std::string(headers) +
           "Content-Length: " + std::to_string(body.size()) + "\r\n\r\n" + std::string(body);
  }

 private:
  void acceptAll() {
    for (;;) {
      platform::UniqueFd fd(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
      if (!fd) return;
      const std::lock_guard lock(_mutex);
      if (_stopping) return;
      const auto entry = _open.insert(_open.end(), fd.get());
      _scripts.emplace_back([this, entry, fd = std::move(fd)]() mutable {
        RawConnection connection(fd.get(), [this](std::string request) { remember(std::move(request)); });
        _script(connection);
        const std::lock_guard scriptEnd(_mutex);
        _open.erase(entry);
        fd.reset();
      });
    }
  }
  void remember(std::string request) {
    const std::lock_guard lock(_mutex);
    _requests.push_back(std::move(request));
    _changed.notify_all();
  }

  const Script _script;
  const platform::UniqueFd _listener{::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)};
  int _port = 0;
  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::vector<std::string> _requests;  // guarded by _mutex
  std::list<int> _open;                // guarded by _mutex: connections whose script runs
  bool _stopping = false;              // guarded by _mutex
  std::vector<std::thread> _scripts;   // guarded by _mutex until the destructor: one for each connection so far
  std::thread _acceptor;
};

}  // namespace orvanta::test
