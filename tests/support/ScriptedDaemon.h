#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FrameDecoder.h"
#include "platform/UniqueFd.h"
#include "platform/Value.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::test {

// The daemon's end of one connection, played by a test step by step. Every wait throws after 30 seconds, so that a
// client that says nothing fails the test instead of hanging it. Used by one thread.
class ScriptedPeer {
 public:
  explicit ScriptedPeer(platform::UniqueFd socket) : _socket(std::move(socket)) {}

  // The next frame; throws when the client has closed instead.
  platform::Frame next();
  // The same, but none when the client has closed.
  std::optional<platform::Frame> nextUntilClosed();
  // The next frame, which must be a call of `method`.
  platform::Frame expect(std::string_view method);
  // The oldest descriptor that has come along; none when there is none.
  platform::UniqueFd takeDescriptor();
  std::size_t waitingDescriptors() const { return _descriptors.size(); }

  void answer(const platform::Frame& request, const platform::Array& results);
  void refuse(const platform::Frame& request, std::string_view text);
  void notify(std::string_view method, const platform::Array& params);
  // A response whose error and result are these values, whatever sense they make.
  void respond(std::uint32_t messageID, const platform::Value& error, const platform::Value& result);
  void sendBytes(std::span<const std::uint8_t> bytes);
  void shutdownSending();
  void close() { _socket.reset(); }

 private:
  bool readMore();  // false at the end of what the client sends

  platform::UniqueFd _socket;
  platform::FrameDecoder _decoder;
  std::deque<platform::UniqueFd> _descriptors;
};

// Listens as the daemon would, in a directory of its own.
class ScriptedDaemon {
 public:
  ScriptedDaemon();
  const std::string& directory() const { return _directory.path(); }
  ScriptedPeer accept();
  // Leaves the socket file behind, as a daemon that was killed does.
  void stopListening() { _listener.reset(); }

 private:
  TemporaryDirectory _directory;
  platform::UniqueFd _listener;
};

}  // namespace orvanta::test
