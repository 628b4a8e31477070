#include "tests/support/RawServer.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <stdexcept>

namespace orvanta::test {

namespace {

std::size_t contentLength(const std::string& headers) {
  std::string lower = headers;
  std::transform(lower.begin(), lower.end(), lower.begin(), [](unsigned char c) { return std::tolower(c); });
  const std::size_t at = lower.find("\r\ncontent-length:");
  return at == std::string::npos ? 0 : std::stoul(headers.substr(at + 17));
}

}  // namespace

bool RawConnection::readMore() {
  std::array<char, 65536> buffer;
  const ssize_t count = ::recv(_fd, buffer.data(), buffer.size(), 0);
  if (count <= 0) return false;
  _pending.append(buffer.data(), static_cast<std::size_t>(count));
  return true;
}

std::optional<std::string> RawConnection::readRequest() {
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
  _server.remember(request);
  return request;
}

bool RawConnection::write(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::send(_fd, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (count <= 0) return false;
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

void RawConnection::reset() {
  const linger abrupt{1, 0};
  ::setsockopt(_fd, SOL_SOCKET, SO_LINGER, &abrupt, sizeof abrupt);
}

void RawConnection::waitForClose() {
  while (readMore()) _pending.clear();
}

RawServer::RawServer(Script script) : _script(std::move(script)) {
  _listener.reset(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
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

RawServer::~RawServer() {
  {
    const std::lock_guard lock(_mutex);
    _stopping = true;
    for (const int fd : _open) ::shutdown(fd, SHUT_RDWR);
  }
  ::shutdown(_listener.get(), SHUT_RDWR);
  _acceptor.join();
  for (std::thread& script : _scripts) script.join();
}

void RawServer::acceptAll() {
  for (;;) {
    platform::UniqueFd fd(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!fd) return;
    const std::lock_guard lock(_mutex);
    if (_stopping) return;
    const auto entry = _open.insert(_open.end(), fd.get());
    ++_accepted;
    _scripts.emplace_back([this, entry, fd = std::move(fd)]() mutable {
      RawConnection connection(*this, fd.get());
      _script(connection);
      const std::lock_guard scriptEnd(_mutex);
      _open.erase(entry);
      fd.reset();
    });
  }
}

void RawServer::remember(std::string request) {
  const std::lock_guard lock(_mutex);
  _requests.push_back(std::move(request));
  _changed.notify_all();
}

std::string RawServer::url(std::string_view path) const {
  return "http://127.0.0.1:" + std::to_string(_port) + std::string(path);
}

std::vector<std::string> RawServer::requests() const {
  const std::lock_guard lock(_mutex);
  return _requests;
}

std::size_t RawServer::connectionCount() const {
  const std::lock_guard lock(_mutex);
  return _accepted;
}

bool RawServer::waitForRequests(std::size_t count) const {
  std::unique_lock lock(_mutex);
  return _changed.wait_for(lock, std::chrono::seconds(30), [&] { return _requests.size() >= count; });
}

RawServer::Script RawServer::answering(std::string answer) {
  return [answer = std::move(answer)](RawConnection& connection) {
    while (connection.readRequest() && connection.write(answer)) {
    }
  };
}

std::string RawServer::response(std::string_view statusLine, std::string_view headers, std::string_view body) {
  return "HTTP/1.1 " + std::string(statusLine) + "\r\n" + std::string(headers) +
         "Content-Length: " + std::to_string(body.size()) + "\r\n\r\n" + std::string(body);
}

}  // namespace orvanta::test
