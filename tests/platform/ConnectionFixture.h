#pragma once

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <condition_variable>
#include <cstring>
#include <filesystem>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "platform/Connection.h"
#include "platform/MessagePack.h"
#include "platform/UniqueFd.h"
#include "platform/WorkQueue.h"
#include "tests/platform/Waiting.h"

namespace orvanta::test {

using namespace platform;
using Bytes = std::vector<std::uint8_t>;

inline Bytes operator+(Bytes left, const Bytes& right) {
  left.insert(left.end(), right.begin(), right.end());
  return left;
}
inline Bytes repeated(const Bytes& bytes, std::size_t times) {
  Bytes result;
  for (std::size_t i = 0; i < times; ++i) result = std::move(result) + bytes;
  return result;
}

// Whole messages.
inline Bytes notification(std::string_view method, const Value& parameter = nullptr) {
  Bytes bytes;
  appendNotificationHeader(bytes, method, 1);
  MessagePackWriter(bytes).value(parameter);
  return bytes;
}
inline Bytes request(std::uint32_t id, std::string_view method) {
  Bytes bytes;
  appendRequestHeader(bytes, id, method, 0);
  return bytes;
}
inline Bytes response(std::uint32_t id, const Value& result) {
  Bytes bytes;
  appendResponseHeader(bytes, id);
  MessagePackWriter writer(bytes);
  writer.nil();
  writer.value(result);
  return bytes;
}

// Keeps what a connection delivers, and hands each frame to `onFrame` on the way. Thread-safe.
class RecordingDelegate final : public ConnectionDelegate {
 public:
  std::function<void(Frame&)> onFrame;  // set before the connection resumes
  std::function<void()> onInvalidated;

  void received(Frame&& frame) override {
    if (onFrame) onFrame(frame);
    change([&] { _methods.push_back(frame.method); });
  }
  void interrupted() override {
    change([&] { ++_interruptions; });
  }
  void invalidated(const std::optional<std::string>& protocolError) override {
    if (onInvalidated) onInvalidated();
    const std::lock_guard lock(_mutex);
    ++_invalidations;
    _protocolError = protocolError;
    _changed.notify_all();
  }

  bool waitForFrames(std::size_t count) {
    return waitFor([&] { return _methods.size() >= count; });
  }
  bool waitForInterruption() {
    return waitFor([&] { return _interruptions > 0; });
  }
  // And whether nothing came behind it.
  bool waitForInvalidation() {
    return waitFor([&] { return _invalidations > 0; }) && !_calledAfterTheEnd;
  }

  // So far.
  std::vector<std::string> methods() const { return locked(_methods); }
  std::size_t frameCount() const { return methods().size(); }
  int interruptions() const { return locked(_interruptions); }
  int invalidations() const { return locked(_invalidations); }
  std::optional<std::string> protocolError() const { return locked(_protocolError); }

 private:
  template <class Step>
  void change(Step step) {
    const std::lock_guard lock(_mutex);
    _calledAfterTheEnd = _calledAfterTheEnd || _invalidations > 0;
    step();
    _changed.notify_all();
  }
  template <class Condition>
  bool waitFor(Condition condition) {
    std::unique_lock lock(_mutex);
    if (!_changed.wait_for(lock, kHangGuard, condition)) hung("a call of the delegate");
    return true;
  }
  template <class T>
  T locked(const T& value) const {
    const std::lock_guard lock(_mutex);
    return value;
  }

  mutable std::mutex _mutex;
  std::condition_variable _changed;
  // Guarded by _mutex.
  std::vector<std::string> _methods;  // of the frames
  int _interruptions = 0;
  int _invalidations = 0;
  bool _calledAfterTheEnd = false;
  std::optional<std::string> _protocolError;
};

// The other end of a connection under test, with blocking calls that give up when something hangs.
class Peer {
 public:
  Peer() = default;
  explicit Peer(UniqueFd socket) : _socket(std::move(socket)) {
    const timeval patience{kHangGuard.count(), 0};
    ::setsockopt(fd(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    ::setsockopt(fd(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
  }

  int fd() const { return _socket.get(); }
  UniqueFd takeSocket() { return std::move(_socket); }
  bool write(std::span<const std::uint8_t> bytes) const {
    while (!bytes.empty()) {
      const ssize_t size = ::send(fd(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
      if (size <= 0) return false;
      bytes = bytes.subspan(static_cast<std::size_t>(size));
    }
    return true;
  }
  bool write(const Bytes& bytes) const { return write(std::span(bytes)); }
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
    return ::sendmsg(fd(), &message, MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
  }
  // Fewer at the end of the stream.
  Bytes read(std::size_t count) const {
    Bytes bytes(count);
    std::size_t filled = 0;
    for (ssize_t size = 1; size > 0 && filled<count; filled += size> 0 ? static_cast<std::size_t>(size) : 0) {
      size = ::recv(fd(), bytes.data() + filled, count - filled, 0);
    }
    bytes.resize(filled);
    return bytes;
  }
  Bytes readToEnd() const { return read(16U << 20U); }  // more than any test sends
  // Waits for the end of the stream; false when bytes come instead.
  bool atEnd() const {
    std::uint8_t byte = 0;
    const ssize_t size = ::recv(fd(), &byte, 1, 0);
    return size == 0 || (size < 0 && errno == ECONNRESET);
  }
  bool hasBytes() const {
    pollfd entry{fd(), POLLIN, 0};
    return ::poll(&entry, 1, 0) == 1;
  }
  void shutdownSending() const { ::shutdown(fd(), SHUT_WR); }
  void shutdownReceiving() const { ::shutdown(fd(), SHUT_RD); }
  void close() { _socket.reset(); }

 private:
  UniqueFd _socket;
};

// A running pool, and connections whose other ends the test holds.
class ConnectionFixture : public ::testing::Test {
 protected:
  ConnectionFixture() { startPool(2); }

  // In place of the pool before.
  void startPool(std::size_t threads) {
    _pool.emplace(threads);
    // The event loop opens its descriptors with the first timer or watch; tests count only those that come later.
    _pool->makeQueue()->makeTimer();
    _pool->start();
  }

  struct Made {
    std::shared_ptr<Connection> connection;
    std::shared_ptr<RecordingDelegate> delegate;
    Peer peer;
    // Declared behind what its handlers use, it stops the pool before that goes, however the test ends.
    std::shared_ptr<void> stop;
  };
  // Not resumed.
  Made make() {
    int fds[2] = {-1, -1};
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds), 0);
    return {Connection::create(*_pool, UniqueFd(fds[0]), {}), std::make_shared<RecordingDelegate>(),
            Peer(UniqueFd(fds[1])), std::shared_ptr<void>(nullptr, [this](void*) {
              if (_pool) _pool->stop();
            })};
  }
  // Resumed.
  Made open(std::function<void(Connection&, Frame&)> onFrame = {}) {
    Made made = make();
    if (onFrame) {
      made.delegate->onFrame = [weak = std::weak_ptr(made.connection), onFrame = std::move(onFrame)](auto& frame) {
        if (const auto connection = weak.lock()) onFrame(*connection, frame);
      };
    }
    made.connection->resume(made.delegate);
    return made;
  }
  void onQueueOf(Connection& connection, const std::function<void()>& step) {
    Counter done;
    connection.queue()->post([&] {
      step();
      done.add();
    });
    ASSERT_TRUE(done.waitFor(1));
  }

  std::optional<WorkPool> _pool;
};

inline std::size_t openDescriptors() {
  const std::filesystem::directory_iterator entries("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
}

}  // namespace orvanta::test
