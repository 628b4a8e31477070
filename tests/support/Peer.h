#pragma once

#include <poll.h>
#include <sys/socket.h>

#include <array>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "interface/RemoteCalls.h"
#include "platform/codec/MessagePack.h"
#include "platform/core/UniqueFd.h"
#include "platform/ipc/Connect.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/FrameDecoder.h"
#include "platform/ipc/SocketIo.h"

namespace orvanta::test {

using Bytes = std::vector<std::uint8_t>;

inline void append(Bytes& bytes, const Bytes& more) {
  bytes.insert(bytes.end(), more.begin(), more.end());
}

// Whole messages.
inline Bytes withValues(Bytes message, const Array& values) {
  platform::MessagePackWriter writer(message);
  for (const auto& value : values) writer.value(value);
  return message;
}
inline Bytes notification(std::string_view method, const Array& params = {}) {
  Bytes header;
  platform::appendNotificationHeader(header, method, params.size());
  return withValues(std::move(header), params);
}
inline Bytes request(std::uint32_t id, std::string_view method, const Array& params = {}) {
  Bytes header;
  platform::appendRequestHeader(header, id, method, params.size());
  return withValues(std::move(header), params);
}
// Error and result are these values, even if they contradict each other.
inline Bytes response(std::uint32_t id, const Value& result, const Value& error = nullptr) {
  Bytes header;
  platform::appendResponseHeader(header, id);
  return withValues(std::move(header), {error, result});
}

// One end of a connection in the hands of a test, which says whole frames or bytes as bad as it wants. Calls block;
// what takes a minute throws, so that an end that says nothing fails the test instead of hanging it. Used by one
// thread, beside which another may write.
class Peer {
 public:
  Peer() = default;
  explicit Peer(platform::UniqueFd socket) : _socket(std::move(socket)) {}

  // False when the other end has gone.
  bool write(const Bytes& all) const {
    for (std::span<const std::uint8_t> bytes(all); !bytes.empty();) {
      await(_socket.get(), POLLOUT);
      const auto sent = platform::sendBytes(_socket.get(), bytes);
      if (sent.kind == platform::Sent::Kind::broken) return false;
      bytes = bytes.subspan(sent.size);
    }
    return true;
  }
  bool writeWithDescriptors(const Bytes& bytes, const std::vector<int>& descriptors) const {
    std::vector<char> control(CMSG_SPACE(sizeof(int) * descriptors.size()));
    iovec vector{const_cast<std::uint8_t*>(bytes.data()), bytes.size()};
    msghdr message{};
    message.msg_iov = &vector;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    *CMSG_FIRSTHDR(&message) = {CMSG_LEN(sizeof(int) * descriptors.size()), SOL_SOCKET, SCM_RIGHTS};
    std::memcpy(CMSG_DATA(CMSG_FIRSTHDR(&message)), descriptors.data(), sizeof(int) * descriptors.size());
    return ::sendmsg(_socket.get(), &message, MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
  }
  // Fewer at the end of the stream.
  Bytes read(std::size_t count) {
    Bytes bytes(count);
    std::size_t filled = 0;
    for (std::size_t size = 1; size > 0 && filled < count; filled += size) {
      size = receive(std::span(bytes).subspan(filled));
    }
    bytes.resize(filled);
    return bytes;
  }
  Bytes readToEnd() { return read(16U << 20U); }  // more than any test sends
  // Waits for the end of the stream; false when bytes come instead.
  bool atEnd() { return read(1).empty(); }
  bool hasBytes() const {
    pollfd entry{_socket.get(), POLLIN, 0};
    return ::poll(&entry, 1, 0) == 1;
  }
  // Nullopt at the end of the stream.
  std::optional<platform::Frame> nextFrame() {
    for (;;) {
      auto outcome = _decoder.next();
      if (auto* frame = std::get_if<platform::Frame>(&outcome)) return std::move(*frame);
      if (auto* error = std::get_if<platform::FrameDecoder::ProtocolError>(&outcome)) {
        throw std::runtime_error("the other end broke the protocol: " + error->text);
      }
      std::array<std::uint8_t, 65'536> buffer;
      const std::size_t size = receive(buffer);
      if (size == 0) return std::nullopt;
      _decoder.append(std::span(buffer).first(size));
    }
  }
  // The oldest descriptor that has come along; empty when there is none.
  platform::UniqueFd takeDescriptor() {
    if (_descriptors.empty()) return {};
    auto oldest = std::move(_descriptors.front());
    _descriptors.erase(_descriptors.begin());
    return oldest;
  }
  std::size_t waitingDescriptors() const { return _descriptors.size(); }

  platform::UniqueFd takeSocket() { return std::move(_socket); }
  void shutdownSending() const { ::shutdown(_socket.get(), SHUT_WR); }
  void shutdownReceiving() const { ::shutdown(_socket.get(), SHUT_RD); }
  void close() { _socket.reset(); }

  static void await(int fd, short events) {
    pollfd wait{fd, events, 0};
    if (::poll(&wait, 1, 60'000) == 0) throw std::runtime_error("waited in vain for the other end");
  }

 private:
  // How many bytes; nullopt at the end of the stream.
  std::size_t receive(std::span<std::uint8_t> buffer) {
    for (;;) {
      await(_socket.get(), POLLIN);
      const auto got = platform::receiveBytes(_socket.get(), buffer, _descriptors);
      if (got.kind != platform::Received::Kind::nothing) return got.size;
    }
  }

  platform::UniqueFd _socket;
  platform::FrameDecoder _decoder{kFrameLimits};
  std::vector<platform::UniqueFd> _descriptors;
};

// A client that speaks bytes, as good or as bad as a test wants.
struct RawClient : Peer {
  explicit RawClient(const std::string& directory)
      : Peer(std::move(platform::connectToService(directory, "com.kovalt.orvantad").value())) {}
  // The next answer; nullopt at the end.
  std::optional<platform::Frame> answer() { return nextFrame(); }
};

}  // namespace orvanta::test
