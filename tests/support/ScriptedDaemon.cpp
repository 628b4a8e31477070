#include "tests/support/ScriptedDaemon.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <utility>
#include <variant>

#include "interface/OrvantaConstants.h"
#include "platform/Connection.h"
#include "platform/MessagePack.h"

namespace orvanta::test {

using platform::Frame;
using platform::UniqueFd;

namespace {

constexpr int kPatienceMilliseconds = 30'000;

[[noreturn]] void fail(const std::string& what) {
  throw std::runtime_error("scripted daemon: " + what);
}

void await(int fd, short events, const char* what) {
  pollfd wait{fd, events, 0};
  int ready = 0;
  do {
    ready = ::poll(&wait, 1, kPatienceMilliseconds);
  } while (ready < 0 && errno == EINTR);
  if (ready == 0) fail(std::string("waited in vain for ") + what);
}

void takeDescriptors(msghdr& header, std::deque<UniqueFd>& out) {
  for (auto* part = CMSG_FIRSTHDR(&header); part != nullptr; part = CMSG_NXTHDR(&header, part)) {
    if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
    const std::size_t count = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < count; ++i) {
      int fd = -1;
      std::memcpy(&fd, CMSG_DATA(part) + i * sizeof(int), sizeof fd);
      out.emplace_back(fd);
    }
  }
}

}  // namespace

bool ScriptedPeer::readMore() {
  await(_socket.get(), POLLIN, "the client's bytes");
  std::array<std::uint8_t, 64 * 1024> buffer;
  alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int) * 16)> control;
  iovec bytes{buffer.data(), buffer.size()};
  msghdr header{};
  header.msg_iov = &bytes;
  header.msg_iovlen = 1;
  header.msg_control = control.data();
  header.msg_controllen = control.size();
  const auto count = ::recvmsg(_socket.get(), &header, MSG_CMSG_CLOEXEC);
  if (count <= 0) return false;
  takeDescriptors(header, _descriptors);
  _decoder.append(std::span(buffer).first(static_cast<std::size_t>(count)));
  return true;
}

std::optional<Frame> ScriptedPeer::nextUntilClosed() {
  for (;;) {
    auto outcome = _decoder.next();
    if (auto* frame = std::get_if<Frame>(&outcome)) return std::move(*frame);
    if (auto* error = std::get_if<platform::FrameDecoder::ProtocolError>(&outcome)) {
      fail("the client broke the protocol: " + error->text);
    }
    if (!readMore()) return std::nullopt;
  }
}

Frame ScriptedPeer::next() {
  auto frame = nextUntilClosed();
  if (!frame) fail("the client closed the connection instead of calling");
  return std::move(*frame);
}

Frame ScriptedPeer::expect(std::string_view method) {
  auto frame = next();
  if (frame.method != method) fail("expected " + std::string(method) + ", the client called " + frame.method);
  return frame;
}

UniqueFd ScriptedPeer::takeDescriptor() {
  if (_descriptors.empty()) return {};
  auto oldest = std::move(_descriptors.front());
  _descriptors.pop_front();
  return oldest;
}

void ScriptedPeer::answer(const Frame& request, const platform::Array& results) {
  respond(request.messageID, nullptr, results);
}

void ScriptedPeer::refuse(const Frame& request, std::string_view text) {
  respond(request.messageID, text, nullptr);
}

void ScriptedPeer::respond(std::uint32_t messageID, const platform::Value& error, const platform::Value& result) {
  std::vector<std::uint8_t> message;
  platform::appendResponseHeader(message, messageID);
  platform::MessagePackWriter out(message);
  out.value(error);
  out.value(result);
  sendBytes(message);
}

void ScriptedPeer::notify(std::string_view method, const platform::Array& params) {
  std::vector<std::uint8_t> message;
  platform::appendNotificationHeader(message, method, params.size());
  platform::MessagePackWriter out(message);
  for (const auto& param : params) out.value(param);
  sendBytes(message);
}

void ScriptedPeer::sendBytes(std::span<const std::uint8_t> bytes) {
  while (!bytes.empty()) {
    await(_socket.get(), POLLOUT, "the client to read");
    const auto count = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
    if (count < 0 && errno == EAGAIN) continue;
    if (count < 0) fail(std::string("the client does not take the answer: ") + std::strerror(errno));
    bytes = bytes.subspan(static_cast<std::size_t>(count));
  }
}

void ScriptedPeer::shutdownSending() {
  ::shutdown(_socket.get(), SHUT_WR);
}

ScriptedDaemon::ScriptedDaemon() : _listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
  const std::string path = _directory / kOrvantaServiceName;
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  if (::bind(_listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(_listener.get(), 64) != 0) {
    fail("cannot listen on " + path);
  }
}

ScriptedPeer ScriptedDaemon::accept() {
  await(_listener.get(), POLLIN, "a client to connect");
  UniqueFd socket(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
  if (!socket) fail("accept failed");
  return ScriptedPeer(std::move(socket));
}

}  // namespace orvanta::test
