#pragma once

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Connection.h"
#include "platform/UniqueFd.h"
#include "platform/WorkQueue.h"
#include "tests/platform/Waiting.h"

namespace orvanta::test {

using Bytes = std::vector<std::uint8_t>;

Bytes operator+(Bytes left, const Bytes& right);
Bytes repeated(const Bytes& bytes, std::size_t times);
// Whole messages with one parameter.
Bytes notification(std::string_view method, const platform::Value& parameter = nullptr);
Bytes request(std::uint32_t id, std::string_view method);
Bytes response(std::uint32_t id, const platform::Value& result);

// Keeps what a connection delivers, and hands each frame to `onFrame` on the way. Thread-safe.
class RecordingDelegate final : public platform::ConnectionDelegate {
 public:
  std::function<void(platform::Frame&)> onFrame;  // set before the connection resumes
  std::function<void()> onInvalidated;

  void received(platform::Frame&& frame) override;
  void interrupted() override;
  void invalidated(const std::optional<std::string>& protocolError) override;

  bool waitForFrames(std::size_t count);
  bool waitForInterruption();
  bool waitForInvalidation();

  // So far.
  std::vector<std::string> methods() const {
    const std::lock_guard lock(_mutex);
    std::vector<std::string> result;
    for (const auto& frame : _frames) result.push_back(frame.method);
    return result;
  }
  std::size_t frameCount() const { return methods().size(); }
  int interruptions() const { return locked(_interruptions); }
  int invalidations() const { return locked(_invalidations); }
  std::optional<std::string> protocolError() const { return locked(_protocolError); }

 private:
  template <class Condition>
  bool waitFor(Condition condition);
  template <class T>
  T locked(const T& value) const {
    const std::lock_guard lock(_mutex);
    return value;
  }

  mutable std::mutex _mutex;
  std::condition_variable _changed;
  // Guarded by _mutex.
  std::vector<platform::Frame> _frames;
  int _interruptions = 0;
  int _invalidations = 0;
  int _afterTheEnd = 0;
  std::optional<std::string> _protocolError;
};

// The other end of a connection under test, with blocking calls that give up when something hangs.
class Peer {
 public:
  Peer() = default;
  explicit Peer(platform::UniqueFd socket);

  int fd() const { return _socket.get(); }
  platform::UniqueFd takeSocket() { return std::move(_socket); }
  bool write(std::span<const std::uint8_t> bytes) const;
  bool write(const Bytes& bytes) const { return write(std::span(bytes)); }
  bool writeWithDescriptors(const Bytes& bytes, const std::vector<int>& descriptors) const;
  Bytes read(std::size_t count) const;  // fewer at the end of the stream
  Bytes readToEnd() const;
  bool atEnd() const;  // waits for the end of the stream; false when bytes come instead
  bool hasBytes() const;
  void shutdownSending() const { ::shutdown(fd(), SHUT_WR); }
  void shutdownReceiving() const { ::shutdown(fd(), SHUT_RD); }
  void close() { _socket.reset(); }

 private:
  platform::UniqueFd _socket;
};

// A running pool, and connections whose other ends the test holds.
class ConnectionFixture : public ::testing::Test {
 protected:
  ConnectionFixture() { startPool(2); }

  struct Made {
    std::shared_ptr<platform::Connection> connection;
    std::shared_ptr<RecordingDelegate> delegate;
    Peer peer;
    // Declared behind what its handlers use, it stops the pool before that goes, however the test ends.
    std::shared_ptr<void> stop;
  };
  void startPool(std::size_t threads);  // in place of the one before
  // Not resumed.
  Made make(platform::ConnectionLimits limits = {});
  // Resumed.
  Made open(std::function<void(platform::Connection&, platform::Frame&)> onFrame = {},
            platform::ConnectionLimits limits = {});
  void onQueueOf(platform::Connection& connection, const std::function<void()>& step);

  std::optional<platform::WorkPool> _pool;
};

std::size_t openDescriptors();

}  // namespace orvanta::test
