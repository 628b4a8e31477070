#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/Connect.h"
#include "platform/Connection.h"
#include "platform/FrameDecoder.h"
#include "platform/MessagePack.h"
#include "platform/SocketIo.h"
#include "platform/UniqueFd.h"
#include "platform/Value.h"

namespace orvanta::test {

using Bytes = std::vector<std::uint8_t>;

inline void append(Bytes& bytes, const Bytes& more) {
  bytes.insert(bytes.end(), more.begin(), more.end());
}

// A client that speaks bytes, as good or as bad as a test wants.
class RawClient {
 public:
  explicit RawClient(const std::string& directory) {
    auto socket = platform::connectToService(directory, "com.kovalt.orvantad");
    EXPECT_TRUE(socket) << socket.error();
    if (socket) _socket = std::move(*socket);
    const int flags = ::fcntl(_socket.get(), F_GETFL);
    ::fcntl(_socket.get(), F_SETFL, flags & ~O_NONBLOCK);
  }
  bool write(const Bytes& bytes) {
    return ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
  }
  // A whole message that a descriptor goes with.
  bool writeWithDescriptor(const Bytes& bytes, int descriptor) {
    return platform::sendBytes(_socket.get(), bytes, descriptor).size == bytes.size();
  }
  // What comes until the daemon closes the connection.
  Bytes readToEnd() {
    Bytes all;
    std::uint8_t buffer[4096];
    for (ssize_t length; (length = ::read(_socket.get(), buffer, sizeof buffer)) > 0;) {
      all.insert(all.end(), buffer, buffer + length);
    }
    return all;
  }
  // The next answer; none at the end.
  std::optional<platform::Frame> answer() {
    for (;;) {
      auto outcome = _decoder.next();
      if (auto* frame = std::get_if<platform::Frame>(&outcome)) return std::move(*frame);
      std::uint8_t buffer[4096];
      const ssize_t length = ::read(_socket.get(), buffer, sizeof buffer);
      if (length <= 0) return std::nullopt;
      _decoder.append({buffer, static_cast<std::size_t>(length)});
    }
  }
  void shutdownSending() { ::shutdown(_socket.get(), SHUT_WR); }

 private:
  platform::UniqueFd _socket;
  platform::FrameDecoder _decoder;
};

inline Bytes request(std::uint32_t id, const char* method, const platform::Array& params = {}) {
  Bytes message;
  platform::appendRequestHeader(message, id, method, params.size());
  platform::MessagePackWriter out(message);
  for (const auto& param : params) out.value(param);
  return message;
}

}  // namespace orvanta::test
