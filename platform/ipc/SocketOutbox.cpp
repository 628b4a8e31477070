#include "platform/ipc/SocketOutbox.h"

#include <fcntl.h>
#include <sys/socket.h>

#include <algorithm>
#include <cassert>
#include <chrono>
#include <limits>
#include <utility>

namespace orvanta::platform {

namespace {

constexpr std::chrono::milliseconds kRetryWhenStarved{50};

// Where a thread gathers: lent to the outbox of the connection whose calls it carries out, so that connections need no
// buffer of their own.
thread_local std::vector<std::uint8_t> tSpare;

void giveBack(std::vector<std::uint8_t>& bytes) {
  std::vector<std::uint8_t>().swap(bytes);
}

}  // namespace

SocketOutbox::SocketOutbox(WorkPool& pool, int socket, std::size_t maximumDroppable)
    : _pool(pool), _maximumDroppable(maximumDroppable), _socket(socket) {}

bool SocketOutbox::send(std::span<const std::uint8_t> message, Urgency urgency) {
  return append(message, urgency, {});
}

bool SocketOutbox::sendWithDescriptor(std::span<const std::uint8_t> message, UniqueFd descriptor) {
  return append(message, Urgency::reply, std::move(descriptor));
}

bool SocketOutbox::append(std::span<const std::uint8_t> message, Urgency urgency, UniqueFd descriptor) {
  std::shared_ptr<Observer> tell;
  bool taken = true;
  {
    const MutexLock lock(_mutex);
    if (_state != State::open) return false;
    if (urgency == Urgency::droppable && waitingBytes() + message.size() > _maximumDroppable) return false;

    const bool gathering = isGathering();
    Sent::Kind last = Sent::Kind::some;
    if (!gathering && !descriptor && waitingBytes() == 0 && mayWrite()) {
      // Straight from the caller's bytes.
      while (!message.empty() && last == Sent::Kind::some) {
        const Sent sent = sendBytes(_socket, message);
        last = sent.kind;
        _sent += sent.size;
        message = message.subspan(sent.size);
      }
      keep(message);
    } else {
      if (descriptor) {
        const std::uint64_t begin = _sent + waitingBytes();
        _attachments.push_back({begin, begin + message.size(), std::move(descriptor)});
      }
      keep(message);
      if (mayWrite() && (!gathering || waitingBytes() > kGatherAtMost)) last = writeWaiting();
    }
    tell = settle(last);
    taken = _state == State::open;
  }
  if (tell) tell->outboxEased();
  return taken;
}

void SocketOutbox::beginGathering() {
  const MutexLock lock(_mutex);
  _gatherer = std::this_thread::get_id();
  if (_bytes.capacity() == 0) _bytes.swap(tSpare);
}

void SocketOutbox::endGathering() {
  std::shared_ptr<Observer> tell;
  {
    const MutexLock lock(_mutex);
    const Sent::Kind last = mayWrite() ? writeWaiting() : Sent::Kind::some;
    if (_bytes.empty() && _bytes.capacity() <= 2 * kGatherAtMost) _bytes.swap(tSpare);
    _gatherer = {};
    tell = settle(last);
  }
  if (tell) tell->outboxEased();
}

void SocketOutbox::writeGathered() {
  std::shared_ptr<Observer> tell;
  {
    const MutexLock lock(_mutex);
    if (!mayWrite()) return;
    tell = settle(writeWaiting());
  }
  if (tell) tell->outboxEased();
}

bool SocketOutbox::isClosed() const {
  const MutexLock lock(_mutex);
  return _state != State::open;
}

bool SocketOutbox::broken() const {
  const MutexLock lock(_mutex);
  return _state == State::broken;
}

bool SocketOutbox::awaitAtMost(std::size_t limit) {
  const MutexLock lock(_mutex);
  if (!isUsable() || waitingBytes() <= limit) return true;
  _awaited = limit;
  return false;
}

void SocketOutbox::finish() {
  std::shared_ptr<Observer> tell;
  {
    const MutexLock lock(_mutex);
    if (_state != State::open) return;
    _state = State::finishing;
    tell = settle(mayWrite() ? writeWaiting() : Sent::Kind::some);
  }
  if (tell) tell->outboxEased();
}

void SocketOutbox::close() {
  const MutexLock lock(_mutex);
  becomeUseless(State::closed);
  _awaited.reset();
  _pending.store(0, std::memory_order_relaxed);
  _socket = -1;
  if (_waiting) _writerQueue->post([self = shared_from_this()] { self->stopWaiting(); });
}

Sent::Kind SocketOutbox::writeWaiting() {
  while (waitingBytes() > 0) {
    const Sent sent = writeSome();
    if (sent.kind != Sent::Kind::some) return sent.kind;
    dropFront(sent.size);
  }
  return Sent::Kind::some;
}

Sent SocketOutbox::writeSome() {
  const std::span<const std::uint8_t> bytes(_bytes.data() + _start, waitingBytes());
  if (_attachments.empty()) return sendBytes(_socket, bytes);
  const Attachment& next = _attachments.front();
  if (next.begin > _sent) return sendBytes(_socket, bytes.first(next.begin - _sent));
  const Sent sent = sendBytes(_socket, bytes.first(next.end - _sent), next.descriptor.get());
  if (sent.kind == Sent::Kind::some) _attachments.erase(_attachments.begin());
  return sent;
}

void SocketOutbox::keep(std::span<const std::uint8_t> rest) {
  if (_start > 0 && _start >= waitingBytes()) {
    // Costs no more than writing what goes away did.
    _bytes.erase(_bytes.begin(), _bytes.begin() + static_cast<std::ptrdiff_t>(_start));
    _start = 0;
  }
  _bytes.insert(_bytes.end(), rest.begin(), rest.end());
}

void SocketOutbox::dropFront(std::size_t count) {
  _sent += count;
  _start += count;
  if (_start < _bytes.size()) return;
  _bytes.clear();
  _start = 0;
}

void SocketOutbox::becomeUseless(State state) {
  _state = state;
  giveBack(_bytes);
  _start = 0;
  _attachments.clear();
}

std::shared_ptr<SocketOutbox::Observer> SocketOutbox::settle(Sent::Kind last) {
  if (last == Sent::Kind::broken && isUsable()) {
    becomeUseless(State::broken);
    _awaited = std::numeric_limits<std::size_t>::max();  // a failure is told whether or not anything was awaited
  }
  const std::size_t waiting = waitingBytes();
  _pending.store(waiting, std::memory_order_relaxed);
  if (waiting == 0) {
    if (_gatherer == std::thread::id()) giveBack(_bytes);
    if (_state == State::finishing) {
      ::shutdown(_socket, SHUT_WR);
      _state = State::finished;
    }
  } else if (last != Sent::Kind::some && !_waiting) {
    startWaiting();
  }
  if (!_awaited || waiting > *_awaited) return nullptr;
  _awaited.reset();
  return _observer.lock();
}

void SocketOutbox::startWaiting() {
  _waiting = true;
  if (!_writerQueue) _writerQueue = _pool.makeQueue();
  // The waiting job keeps the connection alive, which may be waiting for nothing but this.
  _writerQueue->post(
      [self = shared_from_this(), owner = std::shared_ptr<void>(_observer.lock())] { self->waitUntilWritable(owner); });
}

void SocketOutbox::waitUntilWritable(const std::shared_ptr<void>& owner) {
  assert(_writerQueue->isCurrent());
  {
    const MutexLock lock(_mutex);
    if (!isUsable()) return;
    if (!_writer.socket) _writer.socket.reset(::fcntl(_socket, F_DUPFD_CLOEXEC, 0));
  }
  const auto write = [self = shared_from_this(), owner] { self->writeOn(owner); };
  if (_writer.socket && !_writer.watch) _writer.watch = _writerQueue->makeDescriptorWatch(_writer.socket.get());
  if (_writer.watch) {
    _writer.watch->whenWritable(write);
  } else {
    retryLater(owner);
  }
}

void SocketOutbox::retryLater(const std::shared_ptr<void>& owner) {
  assert(_writerQueue->isCurrent());
  if (!_writer.retry) _writer.retry = _writerQueue->makeTimer();
  _writer.retry->runAfter(kRetryWhenStarved, [self = shared_from_this(), owner] { self->writeOn(owner); });
}

void SocketOutbox::writeOn(const std::shared_ptr<void>& owner) {
  assert(_writerQueue->isCurrent());
  std::shared_ptr<Observer> tell;
  Sent::Kind last = Sent::Kind::some;
  bool more = false;
  {
    const MutexLock lock(_mutex);
    if (isUsable()) last = writeWaiting();
    more = isUsable() && last != Sent::Kind::broken && waitingBytes() > 0;
    _waiting = more;
    tell = settle(last);
  }
  if (!more) {
    stopWaiting();
  } else if (last == Sent::Kind::starved) {
    retryLater(owner);
  } else {
    waitUntilWritable(owner);
  }
  if (tell) tell->outboxEased();
}

void SocketOutbox::stopWaiting() {
  assert(_writerQueue->isCurrent());
  _writer.watch.reset();  // before its descriptor, whose number may then come to mean another
  _writer.retry.reset();
  _writer.socket.reset();
}

}  // namespace orvanta::platform
