#pragma once

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <atomic>
#include <filesystem>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/ipc/Connection.h"
#include "platform/queue/WorkQueue.h"
#include "tests/platform/Waiting.h"
#include "tests/support/Peer.h"

namespace orvanta::test {

using namespace orvanta::platform;
inline Bytes operator+(Bytes left, const Bytes& right) {
  append(left, right);
  return left;
}
inline Bytes repeated(const Bytes& bytes, std::size_t times) {
  Bytes result;
  for (std::size_t i = 0; i < times; ++i) append(result, bytes);
  return result;
}

// Keeps what a connection delivers, and hands each frame to `onFrame` on the way. Thread-safe.
class RecordingDelegate final : public ConnectionDelegate {
 public:
  std::function<void(Frame&)> onFrame;  // set before the connection resumes
  std::function<void()> onInvalidated;

  void received(Frame&& frame) override {
    if (onFrame) onFrame(frame);
    if (_invalidations.value() > 0) _calledAfterTheEnd = true;
    {
      const std::lock_guard lock(_mutex);
      _methods.push_back(frame.method);
    }
    _frames.add();
  }
  void interrupted() override {
    if (_invalidations.value() > 0) _calledAfterTheEnd = true;
    _interruptions.add();
  }
  void invalidated(const std::optional<std::string>& protocolError) override {
    if (onInvalidated) onInvalidated();
    {
      const std::lock_guard lock(_mutex);
      _protocolError = protocolError;
    }
    _invalidations.add();
  }

  bool waitForFrames(int count) { return _frames.waitFor(count); }
  bool waitForInterruption() { return _interruptions.waitFor(1); }
  // And whether nothing came behind it.
  bool waitForInvalidation() { return _invalidations.waitFor(1) && !_calledAfterTheEnd; }

  // So far.
  int frameCount() const { return _frames.value(); }
  int interruptions() const { return _interruptions.value(); }
  int invalidations() const { return _invalidations.value(); }
  std::vector<std::string> methods() const {
    const std::lock_guard lock(_mutex);
    return _methods;
  }
  std::optional<std::string> protocolError() const {
    const std::lock_guard lock(_mutex);
    return _protocolError;
  }

 private:
  Counter _frames, _interruptions, _invalidations;
  std::atomic<bool> _calledAfterTheEnd = false;
  mutable std::mutex _mutex;
  std::vector<std::string> _methods;          // guarded by _mutex: of the frames
  std::optional<std::string> _protocolError;  // guarded by _mutex
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
    return {Connection::create(*_pool, UniqueFd(fds[0]), kDaemonConnectionLimits),
            std::make_shared<RecordingDelegate>(), Peer(UniqueFd(fds[1])),
            std::shared_ptr<void>(nullptr, [this](void*) {
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
