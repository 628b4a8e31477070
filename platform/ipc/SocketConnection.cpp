#include "platform/ipc/SocketConnection.h"

#include <array>
#include <cassert>
#include <utility>
#include <variant>

#include "platform/ipc/SocketIo.h"

namespace orvanta::platform {

namespace {

constexpr std::size_t kReadSize = 64U << 10U;
// A frame that arrives over many reads must not hold a thread for all of them.
constexpr int kReadsPerTurn = 16;
// Nor must calls that take long one by one. Asked at every so many.
constexpr std::chrono::milliseconds kTurn{2};
constexpr int kFramesBetweenLooks = 8;
// With so much to carry out the thread is away for milliseconds.
constexpr std::size_t kLargeFrame = 32U << 10U;
// A peer that broke the protocol still gets the replies to what came before.
constexpr std::chrono::milliseconds kDrainAfterProtocolError{1000};

std::span<std::uint8_t> readBuffer() {
  thread_local const auto buffer = std::make_unique<std::array<std::uint8_t, kReadSize>>();
  return *buffer;
}

// While calls are carried out on this thread their replies are gathered, and written when the thread blocks or is done.
class Gathering {
 public:
  explicit Gathering(SocketOutbox& outbox) : _outbox(outbox) {
    _outbox.beginGathering();
    _before = BlockingScope::setBeforeBlocking(
        {[](void* context) { static_cast<SocketOutbox*>(context)->writeGathered(); }, &_outbox});
  }
  ~Gathering() {
    BlockingScope::setBeforeBlocking(_before);
    _outbox.endGathering();
  }
  Gathering(const Gathering&) = delete;
  Gathering& operator=(const Gathering&) = delete;

 private:
  SocketOutbox& _outbox;
  BlockingScope::HookSetting _before;
};

}  // namespace

std::shared_ptr<Connection> Connection::create(WorkPool& pool, UniqueFd socket, ConnectionLimits limits) {
  return SocketConnection::create(pool, std::move(socket), limits);
}

std::shared_ptr<SocketConnection> SocketConnection::create(WorkPool& pool, UniqueFd socket, ConnectionLimits limits) {
  auto connection = std::make_shared<SocketConnection>(pool, std::move(socket), limits);
  connection->_outbox->setObserver(connection);
  return connection;
}

SocketConnection::SocketConnection(WorkPool& pool, UniqueFd socket, ConnectionLimits limits)
    : _limits(limits),
      _queue(pool.makeQueue()),
      _outbox(std::make_shared<SocketOutbox>(pool, socket.get(), limits.maximumDroppable)),
      _publicOutbox(_outbox),
      _description("fd " + std::to_string(socket.get())),
      _socket(std::move(socket)),
      _decoder(limits.frame) {}

SocketConnection::~SocketConnection() {
  _watch.reset();
  _outbox->close();  // before the socket: reply handles may still hold the outbox
}

void SocketConnection::later(void (SocketConnection::*step)()) {
  _queue->post([self = self(), step] { (*self.*step)(); });
}

void SocketConnection::resume(std::shared_ptr<ConnectionDelegate> delegate) {
  _queue->post([self = self(), delegate = std::move(delegate)]() mutable { self->begin(std::move(delegate)); });
}

void SocketConnection::begin(std::shared_ptr<ConnectionDelegate> delegate) {
  assert(_queue->isCurrent());
  if (_phase == Phase::ended) {  // cancelled before
    delegate->invalidated(std::nullopt);
    return;
  }
  _phase = Phase::open;
  _delegate = std::move(delegate);
  _watch = _queue->makeDescriptorWatch(_socket.get());
  if (!_watch) return end();
  takeTurn();
}

void SocketConnection::takeTurn() {
  assert(_queue->isCurrent());
  if (_phase != Phase::open) return;
  Pause pause;
  {
    const Gathering gathering(*_outbox);
    pause = carryOut();
  }
  switch (pause) {
    case Pause::readable:
      _watch->whenReadable([self = self()] { self->takeTurn(); });
      break;
    case Pause::turnUsedUp:
      later(&SocketConnection::takeTurn);
      break;
    case Pause::repliesUnread:
      _waitsForReplies = !_outbox->awaitAtMost(_limits.maximumUnreadReplies);
      if (!_waitsForReplies) later(&SocketConnection::takeTurn);
      break;
    case Pause::endOfInput:
      inputEnded();
      break;
    case Pause::protocolError:
      endAfterDrain(kDrainAfterProtocolError);
      break;
  }
}

SocketConnection::Pause SocketConnection::carryOut() {
  int frames = 0;
  const auto end = std::chrono::steady_clock::now() + kTurn;
  for (int reads = 0; reads < kReadsPerTurn; ++reads) {
    if (const auto pause = carryOutFrames(frames, end)) return *pause;
    if (_protocolError) return Pause::protocolError;
    if (_endOfInput) return Pause::endOfInput;
    if (std::exchange(_socketEmpty, false)) return Pause::readable;
    readOnce();
  }
  return Pause::turnUsedUp;
}

// Until no whole frame is left, or something stands in the way.
std::optional<SocketConnection::Pause> SocketConnection::carryOutFrames(int& carriedOut,
                                                                        std::chrono::steady_clock::time_point end) {
  for (;;) {
    if (carriedOut == kFramesPerTurn) return Pause::turnUsedUp;
    const bool look = carriedOut > 0 && carriedOut % kFramesBetweenLooks == 0;
    if (look && std::chrono::steady_clock::now() >= end) return Pause::turnUsedUp;
    if (_outbox->pending() > _limits.maximumUnreadReplies) return Pause::repliesUnread;
    std::optional<BlockingScope> large;
    if (_decoder.mayHoldMoreThan(kLargeFrame)) large.emplace();
    FrameDecoder::Outcome outcome = _decoder.next();
    if (std::holds_alternative<FrameDecoder::NeedMore>(outcome)) return std::nullopt;
    if (auto* const error = std::get_if<FrameDecoder::ProtocolError>(&outcome)) {
      _protocolError = std::move(error->text);
      return Pause::protocolError;
    }
    ++carriedOut;
    auto& frame = std::get<Frame>(outcome);
    if (!large && frame.wireSize > kLargeFrame) large.emplace();
    _delegate->received(std::move(frame));
  }
}

void SocketConnection::readOnce() {
  const std::span<std::uint8_t> buffer = readBuffer();
  const std::size_t descriptors = _descriptors.size();
  const Received received = receiveBytes(_socket.get(), buffer, _descriptors);
  switch (received.kind) {
    case Received::Kind::nothing:
      _socketEmpty = true;
      return;
    case Received::Kind::endOfFile:
    case Received::Kind::broken:
      _endOfInput = true;
      return;
    case Received::Kind::bytes:
      break;
  }
  // One read ends where descriptors came along, even if more bytes lie behind.
  _socketEmpty = received.size < buffer.size() && _descriptors.size() == descriptors;
  _decoder.append(buffer.first(received.size));
  if (received.descriptorsLost) {
    _protocolError = "descriptors were lost on their way";
  } else if (_descriptors.size() > _limits.maximumWaitingDescriptors) {
    _protocolError = "more than " + std::to_string(_limits.maximumWaitingDescriptors) + " descriptors wait";
  }
}

UniqueFd SocketConnection::takeDescriptor() {
  assert(_queue->isCurrent());
  if (_descriptors.empty()) return {};
  UniqueFd oldest = std::move(_descriptors.front());
  _descriptors.erase(_descriptors.begin());
  return oldest;
}

void SocketConnection::outboxEased() {
  later(&SocketConnection::eased);
}

void SocketConnection::eased() {
  assert(_queue->isCurrent());
  switch (_phase) {
    case Phase::open:
      if (std::exchange(_waitsForReplies, false)) takeTurn();
      break;
    case Phase::halfClosed:
      if (_outbox->broken()) end();
      break;
    case Phase::draining:
      if (_outbox->awaitAtMost(0)) end();
      break;
    case Phase::fresh:
    case Phase::ended:
      break;
  }
}

void SocketConnection::inputEnded() {
  assert(_queue->isCurrent());
  if (hasHungUp(_socket.get()) || _outbox->broken()) {
    end();
    return;
  }
  _phase = Phase::halfClosed;
  _watch->whenHungUp([self = self()] { self->end(); });
  _delegate->interrupted();
}

void SocketConnection::cancel(std::chrono::milliseconds drainReplies) {
  _queue->post([self = self(), drainReplies] {
    if (self->_phase == Phase::open) self->carryOutRest();
    if (self->_phase != Phase::ended) self->endAfterDrain(drainReplies);
  });
}

// Frames that have been read are carried out in spite of the end: their sender may take them for delivered.
void SocketConnection::carryOutRest() {
  assert(_queue->isCurrent());
  const Gathering gathering(*_outbox);
  for (;;) {
    FrameDecoder::Outcome outcome = _decoder.next();
    if (!std::holds_alternative<Frame>(outcome)) return;
    _delegate->received(std::get<Frame>(std::move(outcome)));
  }
}

void SocketConnection::endAfterDrain(std::chrono::milliseconds timeout) {
  assert(_queue->isCurrent());
  if (timeout.count() <= 0 || _outbox->awaitAtMost(0)) {
    end();
    return;
  }
  if (_phase == Phase::draining) return;  // has begun before
  _phase = Phase::draining;
  _watch.reset();
  _drainTimer = _queue->makeTimer();
  _drainTimer->runAfter(timeout, [self = self()] { self->end(); });
}

void SocketConnection::end() {
  assert(_queue->isCurrent());
  if (_phase == Phase::ended) return;
  _phase = Phase::ended;
  _watch.reset();
  _drainTimer.reset();
  if (const auto delegate = std::move(_delegate)) delegate->invalidated(_protocolError);
  _outbox->close();
  // Closing what a peer passed, or left unread in the socket, takes as long as the peer likes.
  const BlockingScope blocking;
  _descriptors.clear();
  _decoder = FrameDecoder(_limits.frame);
  _socket.reset();
}

}  // namespace orvanta::platform
