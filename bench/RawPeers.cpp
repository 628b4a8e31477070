#include "bench/RawPeers.h"

#include <netinet/in.h>
#include <netinet/tcp.h>
#include <signal.h>
#include <sys/epoll.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <stdexcept>
#include <unordered_map>
#include <vector>

namespace orvanta::bench {

namespace {

[[noreturn]] void serveEcho(int listener, std::size_t requestSize, std::size_t answerSize) {
  std::vector<char> buffer(1U << 16U);
  const std::vector<char> answers(answerSize * (buffer.size() / requestSize + 1), 'a');
  for (;;) {
    const int client = ::accept(listener, nullptr, nullptr);
    if (client < 0) continue;
    std::size_t pending = 0;
    for (;;) {
      const ssize_t got = ::read(client, buffer.data(), buffer.size());
      if (got <= 0) break;
      pending += static_cast<std::size_t>(got);
      const std::size_t whole = pending / requestSize;
      pending %= requestSize;
      if (whole > 0 && ::write(client, answers.data(), whole * answerSize) < 0) break;
    }
    ::close(client);
  }
}

// The part of an unfinished request that has arrived on a connection.
struct HalfRequest {
  std::string head;
  std::size_t bodyLeft = 0;
};

// Returns how many requests the bytes completed.
int completed(HalfRequest& half, const char* bytes, std::size_t length) {
  int requests = 0;
  while (length > 0) {
    if (half.bodyLeft > 0) {
      const std::size_t taken = std::min(half.bodyLeft, length);
      half.bodyLeft -= taken;
      bytes += taken;
      length -= taken;
      if (half.bodyLeft == 0) ++requests;
      continue;
    }
    half.head.append(bytes, length);
    const auto end = half.head.find("\r\n\r\n");
    if (end == std::string::npos) return requests;
    const auto at = half.head.find("Content-Length: ");
    const std::size_t body = at < end ? std::strtoul(half.head.c_str() + at + 16, nullptr, 10) : 0;
    const std::size_t over = half.head.size() - end - 4;
    bytes += length - over;
    length = over;
    half.head.clear();
    half.bodyLeft = body;
    if (body == 0) ++requests;
  }
  return requests;
}

[[noreturn]] void servePosts(int listener, volatile std::uint64_t* posts) {
  constexpr char kAnswer[] = "HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n";
  const int poll = ::epoll_create1(0);
  epoll_event event{};
  event.events = EPOLLIN;
  event.data.fd = listener;
  ::epoll_ctl(poll, EPOLL_CTL_ADD, listener, &event);
  std::unordered_map<int, HalfRequest> clients;
  std::vector<char> buffer(1U << 16U);
  for (;;) {
    if (::epoll_wait(poll, &event, 1, -1) != 1) continue;
    const int fd = event.data.fd;
    if (fd == listener) {
      const int client = ::accept(listener, nullptr, nullptr);
      if (client < 0) continue;
      const int on = 1;
      ::setsockopt(client, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
      event.data.fd = client;
      ::epoll_ctl(poll, EPOLL_CTL_ADD, client, &event);
      clients[client] = {};
      continue;
    }
    const ssize_t got = ::read(fd, buffer.data(), buffer.size());
    if (got <= 0) {
      clients.erase(fd);
      ::close(fd);
      continue;
    }
    for (int i = completed(clients[fd], buffer.data(), static_cast<std::size_t>(got)); i > 0; --i) {
      if (::write(fd, kAnswer, sizeof kAnswer - 1) < 0) break;
      *posts = *posts + 1;
    }
  }
}

[[noreturn]] void takeDatagrams(int socket, volatile std::uint64_t* datagrams) {
  char buffer[2048];
  for (;;) {
    if (::recv(socket, buffer, sizeof buffer, 0) >= 0) *datagrams = *datagrams + 1;
  }
}

// A counter in memory that is shared with a forked process.
volatile std::uint64_t* sharedCounter() {
  void* const memory =
      ::mmap(nullptr, sizeof(std::uint64_t), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  if (memory == MAP_FAILED) throw std::runtime_error("no shared memory");
  return static_cast<volatile std::uint64_t*>(memory);
}

// Binds to any free port of the loopback address.
int boundSocket(int type, std::uint16_t& port) {
  const int socket = ::socket(AF_INET, type | SOCK_CLOEXEC, 0);
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t length = sizeof address;
  if (::bind(socket, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 ||
      ::getsockname(socket, reinterpret_cast<sockaddr*>(&address), &length) != 0) {
    throw std::runtime_error("no port on the loopback address");
  }
  port = ntohs(address.sin_port);
  return socket;
}

}  // namespace

RawPeer::~RawPeer() {
  if (_pid <= 0) return;
  ::kill(_pid, SIGKILL);
  ::waitpid(_pid, nullptr, 0);
}

EchoServer::EchoServer(const std::string& socketPath, std::size_t requestSize, std::size_t answerSize) {
  const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, socketPath.c_str(), sizeof address.sun_path - 1);
  if (::bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 || ::listen(listener, 16) != 0) {
    throw std::runtime_error("cannot listen on " + socketPath);
  }
  _pid = ::fork();
  if (_pid == 0) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    serveEcho(listener, requestSize, answerSize);
  }
  ::close(listener);
}

PostSink::PostSink() : _posts(sharedCounter()) {
  const int listener = boundSocket(SOCK_STREAM, _port);
  if (::listen(listener, 64) != 0) throw std::runtime_error("cannot listen for posts");
  _pid = ::fork();
  if (_pid == 0) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    servePosts(listener, _posts);
  }
  ::close(listener);
}

std::uint64_t PostSink::posts() const {
  return *_posts;
}

DatagramSink::DatagramSink() : _datagrams(sharedCounter()) {
  const int socket = boundSocket(SOCK_DGRAM, _port);
  const int size = 8 << 20;
  ::setsockopt(socket, SOL_SOCKET, SO_RCVBUFFORCE, &size, sizeof size);
  _pid = ::fork();
  if (_pid == 0) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    takeDatagrams(socket, _datagrams);
  }
  ::close(socket);
}

std::uint64_t DatagramSink::datagrams() const {
  return *_datagrams;
}

}  // namespace orvanta::bench
