#pragma once

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <deque>
#include <optional>
#include <span>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "interface/OrvantaConstants.h"
#include "platform/Connection.h"
#include "platform/FrameDecoder.h"
#include "platform/MessagePack.h"
#include "platform/UniqueFd.h"
#include "platform/UnixAddress.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::test {

// The daemon's end of one connection, played by a test step by step. Every wait throws after 30 seconds, so that a
// client that says nothing fails the test instead of hanging it. Used by one thread.
class ScriptedPeer {
 public:
  using Frame = platform::Frame;

  explicit ScriptedPeer(platform::UniqueFd socket) : _socket(std::move(socket)) {}

  // The next frame; throws when the client has closed instead.
  Frame next() {
    auto frame = nextUntilClosed();
    if (!frame) fail("the client closed the connection instead of calling");
    return std::move(*frame);
  }
  // The same, but none when the client has closed.
  std::optional<Frame> nextUntilClosed() {
    for (;;) {
      auto outcome = _decoder.next();
      if (auto* frame = std::get_if<Frame>(&outcome)) return std::move(*frame);
      if (auto* error = std::get_if<platform::FrameDecoder::ProtocolError>(&outcome)) {
        fail("the client broke the protocol: " + error->text);
      }
      if (!readMore()) return std::nullopt;
    }
  }
  // The next frame, which must be a call of `method`.
  Frame expect(std::string_view method) {
    auto frame = next();
    if (frame.method != method) fail("expected " + std::string(method) + ", the client called " + frame.method);
    return frame;
  }
  // The oldest descriptor that has come along; none when there is none.
  platform::UniqueFd takeDescriptor() {
    if (_descriptors.empty()) return {};
    auto oldest = std::move(_descriptors.front());
    _descriptors.pop_front();
    return oldest;
  }
  std::size_t waitingDescriptors() const { return _descriptors.size(); }

  void answer(const Frame& request, const platform::Array& results) { respond(request.messageID, nullptr, results); }
  void refuse(const Frame& request, std::string_view text) { respond(request.messageID, text, nullptr); }
  void notify(std::string_view method, const platform::Array& params) {
    std::vector<std::uint8_t> message;
    platform::appendNotificationHeader(message, method, params.size());
    platform::MessagePackWriter out(message);
    for (const auto& param : params) out.value(param);
    sendBytes(message);
  }
  // A response whose error and result are these values, whatever sense they make.
  void respond(std::uint32_t messageID, const platform::Value& error, const platform::Value& result) {
    std::vector<std::uint8_t> message;
    platform::appendResponseHeader(message, messageID);
    platform::MessagePackWriter out(message);
    out.value(error);
    out.value(result);
    sendBytes(message);
  }
  void sendBytes(std::span<const std::uint8_t> bytes) {
    while (!bytes.empty()) {
      await(_socket.get(), POLLOUT, "the client to read");
      const auto count = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
      if (count < 0 && errno == EAGAIN) continue;
      if (count < 0) fail(std::string("the client does not take the answer: ") + std::strerror(errno));
      bytes = bytes.subspan(static_cast<std::size_t>(count));
    }
  }
  void shutdownSending() { ::shutdown(_socket.get(), SHUT_WR); }
  void close() { _socket.reset(); }

 private:
  friend class ScriptedDaemon;
  [[noreturn]] static void fail(const std::string& what) { throw std::runtime_error("scripted daemon: " + what); }
  static void await(int fd, short events, const char* what) {
    pollfd wait{fd, events, 0};
    int ready = 0;
    do {
      ready = ::poll(&wait, 1, 30'000);
    } while (ready < 0 && errno == EINTR);
    if (ready == 0) fail(std::string("waited in vain for ") + what);
  }
  // False at the end of what the client sends.
  bool readMore() {
    await(_socket.get(), POLLIN, "the client's bytes");
    std::array<std::uint8_t, 65'536> buffer;
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int) * 16)> control;
    iovec bytes{buffer.data(), buffer.size()};
    msghdr header{};
    header.msg_iov = &bytes;
    header.msg_iovlen = 1;
    header.msg_control = control.data();
    header.msg_controllen = control.size();
    const auto count = ::recvmsg(_socket.get(), &header, MSG_CMSG_CLOEXEC);
    if (count <= 0) return false;
    for (auto* part = CMSG_FIRSTHDR(&header); part != nullptr; part = CMSG_NXTHDR(&header, part)) {
      if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
      for (std::size_t at = 0; at + sizeof(int) <= part->cmsg_len - CMSG_LEN(0); at += sizeof(int)) {
        int fd = -1;
        std::memcpy(&fd, CMSG_DATA(part) + at, sizeof fd);
        _descriptors.emplace_back(fd);
      }
    }
    _decoder.append(std::span(buffer).first(static_cast<std::size_t>(count)));
    return true;
  }

  platform::UniqueFd _socket;
  platform::FrameDecoder _decoder;
  std::deque<platform::UniqueFd> _descriptors;
};

// Listens as the daemon would, in a directory of its own.
class ScriptedDaemon {
 public:
  ScriptedDaemon() : _listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const auto address = platform::unixAddress(_directory / kOrvantaServiceName);
    if (::bind(_listener.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) != 0 ||
        ::listen(_listener.get(), 64) != 0) {
      ScriptedPeer::fail("cannot listen in " + directory());
    }
  }
  const std::string& directory() const { return _directory.path(); }
  ScriptedPeer accept() {
    ScriptedPeer::await(_listener.get(), POLLIN, "a client to connect");
    platform::UniqueFd socket(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!socket) ScriptedPeer::fail("accept failed");
    return ScriptedPeer(std::move(socket));
  }
  // Leaves the socket file behind, as a daemon that was killed does.
  void stopListening() { _listener.reset(); }

 private:
  TemporaryDirectory _directory;
  platform::UniqueFd _listener;
};

}  // namespace orvanta::test
