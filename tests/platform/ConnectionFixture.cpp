#include "tests/platform/ConnectionFixture.h"

#include <poll.h>
#include <sys/time.h>

#include <cstring>
#include <filesystem>
#include <utility>

#include "platform/MessagePack.h"

namespace orvanta::test {

Bytes operator+(Bytes left, const Bytes& right) {
  left.insert(left.end(), right.begin(), right.end());
  return left;
}

Bytes repeated(const Bytes& bytes, std::size_t times) {
  Bytes result;
  for (std::size_t i = 0; i < times; ++i) result.insert(result.end(), bytes.begin(), bytes.end());
  return result;
}

Bytes notification(std::string_view method, const platform::Value& parameter) {
  Bytes bytes;
  platform::appendNotificationHeader(bytes, method, 1);
  platform::MessagePackWriter(bytes).value(parameter);
  return bytes;
}

Bytes request(std::uint32_t id, std::string_view method) {
  Bytes bytes;
  platform::appendRequestHeader(bytes, id, method, 0);
  return bytes;
}

Bytes response(std::uint32_t id, const platform::Value& result) {
  Bytes bytes;
  platform::appendResponseHeader(bytes, id);
  platform::MessagePackWriter writer(bytes);
  writer.nil();
  writer.value(result);
  return bytes;
}

void RecordingDelegate::received(platform::Frame&& frame) {
  if (onFrame) onFrame(frame);
  const std::lock_guard lock(_mutex);
  if (_invalidations > 0) ++_afterTheEnd;
  _frames.push_back(std::move(frame));
  _changed.notify_all();
}

void RecordingDelegate::interrupted() {
  const std::lock_guard lock(_mutex);
  if (_invalidations > 0) ++_afterTheEnd;
  ++_interruptions;
  _changed.notify_all();
}

void RecordingDelegate::invalidated(const std::optional<std::string>& protocolError) {
  if (onInvalidated) onInvalidated();
  const std::lock_guard lock(_mutex);
  ++_invalidations;
  _protocolError = protocolError;
  _changed.notify_all();
}

template <class Condition>
bool RecordingDelegate::waitFor(Condition condition) {
  std::unique_lock lock(_mutex);
  if (!_changed.wait_for(lock, kHangGuard, condition)) hung("a call of the delegate");
  return true;
}

bool RecordingDelegate::waitForFrames(std::size_t count) {
  return waitFor([&] { return _frames.size() >= count; });
}
bool RecordingDelegate::waitForInterruption() {
  return waitFor([&] { return _interruptions > 0; });
}
bool RecordingDelegate::waitForInvalidation() {
  return waitFor([&] { return _invalidations > 0; }) && _afterTheEnd == 0;
}

Peer::Peer(platform::UniqueFd socket) : _socket(std::move(socket)) {
  const timeval patience{kHangGuard.count(), 0};
  ::setsockopt(fd(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  ::setsockopt(fd(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
}

bool Peer::write(std::span<const std::uint8_t> bytes) const {
  while (!bytes.empty()) {
    const ssize_t size = ::send(fd(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (size <= 0) return false;
    bytes = bytes.subspan(static_cast<std::size_t>(size));
  }
  return true;
}

bool Peer::writeWithDescriptors(const Bytes& bytes, const std::vector<int>& descriptors) const {
  std::vector<char> control(CMSG_SPACE(sizeof(int) * descriptors.size()));
  iovec vector{const_cast<std::uint8_t*>(bytes.data()), bytes.size()};
  msghdr message{};
  message.msg_iov = &vector;
  message.msg_iovlen = 1;
  message.msg_control = control.data();
  message.msg_controllen = control.size();
  cmsghdr* const header = CMSG_FIRSTHDR(&message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof(int) * descriptors.size());
  std::memcpy(CMSG_DATA(header), descriptors.data(), sizeof(int) * descriptors.size());
  return ::sendmsg(fd(), &message, MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

Bytes Peer::read(std::size_t count) const {
  Bytes bytes(count);
  std::size_t filled = 0;
  while (filled < count) {
    const ssize_t size = ::recv(fd(), bytes.data() + filled, count - filled, 0);
    if (size <= 0) break;
    filled += static_cast<std::size_t>(size);
  }
  bytes.resize(filled);
  return bytes;
}

Bytes Peer::readToEnd() const {
  Bytes all = read(1U << 16U);
  for (Bytes part = all; part.size() == (1U << 16U);) all = std::move(all) + (part = read(1U << 16U));
  return all;
}

bool Peer::atEnd() const {
  std::uint8_t byte = 0;
  const ssize_t size = ::recv(fd(), &byte, 1, 0);
  return size == 0 || (size < 0 && errno == ECONNRESET);
}

bool Peer::hasBytes() const {
  pollfd entry{fd(), POLLIN, 0};
  return ::poll(&entry, 1, 0) == 1;
}

void ConnectionFixture::startPool(std::size_t threads) {
  _pool.emplace(threads);
  // The event loop opens its descriptors with the first timer or watch; tests count only those that come later.
  _pool->makeQueue()->makeTimer();
  _pool->start();
}

ConnectionFixture::Made ConnectionFixture::make(platform::ConnectionLimits limits) {
  int fds[2] = {-1, -1};
  EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds), 0);
  Made made;
  made.connection = platform::Connection::create(*_pool, platform::UniqueFd(fds[0]), limits);
  made.delegate = std::make_shared<RecordingDelegate>();
  made.peer = Peer(platform::UniqueFd(fds[1]));
  made.stop = std::shared_ptr<void>(nullptr, [this](void*) {
    if (_pool) _pool->stop();
  });
  return made;
}

ConnectionFixture::Made ConnectionFixture::open(std::function<void(platform::Connection&, platform::Frame&)> onFrame,
                                                platform::ConnectionLimits limits) {
  Made made = make(limits);
  if (onFrame) {
    made.delegate->onFrame = [weak = std::weak_ptr(made.connection), onFrame = std::move(onFrame)](auto& frame) {
      if (const auto connection = weak.lock()) onFrame(*connection, frame);
    };
  }
  made.connection->resume(made.delegate);
  return made;
}

void ConnectionFixture::onQueueOf(platform::Connection& connection, const std::function<void()>& step) {
  Counter done;
  connection.queue()->post([&] {
    step();
    done.add();
  });
  ASSERT_TRUE(done.waitFor(1));
}

std::size_t openDescriptors() {
  std::size_t count = 0;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) ++count;
  return count;
}

}  // namespace orvanta::test
