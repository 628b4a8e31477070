#include "client/CallChannel.h"

#include <fmt/format.h>
#include <unistd.h>

#include <future>
#include <type_traits>
#include <utility>
#include <variant>

#include "interface/OrvantaConstants.h"

namespace orvanta {

using platform::Frame;
using platform::MutexLock;

namespace {

// The socket does not report that the daemon has read more. An answer implies it; in between we look from time to time.
constexpr std::chrono::milliseconds kRoomInterval{10};

// Fails a reply of any kind. Calls into the program.
void failReply(PendingReply&& reply, const CallError& error) {
  std::visit(
      [&error](auto& held) {
        if constexpr (!std::is_same_v<std::decay_t<decltype(held)>, std::monostate>) held.fail(error);
      },
      reply);
}

}  // namespace

bool PendingReplies::add(std::uint32_t messageID, PendingReply&& reply) {
  return _replies.try_emplace(messageID, std::move(reply)).second;
}

PendingReply PendingReplies::take(std::uint32_t messageID) {
  const auto node = _replies.extract(messageID);
  return node.empty() ? PendingReply{} : std::move(node.mapped());
}

void PendingReplies::failAll(const CallError& error) {
  while (!_replies.empty()) failReply(std::move(_replies.extract(_replies.begin()).mapped()), error);
}

CallChannel::CallChannel(std::shared_ptr<platform::Connection> connection, const CallbackThread& thread,
                         std::size_t maximumWaitingBytes)
    : _connection(std::move(connection)), _thread(thread), _maximumWaitingBytes(maximumWaitingBytes) {}

CallChannel::~CallChannel() = default;

void CallChannel::start() {
  _connection->resume(shared_from_this());
}

void CallChannel::submit(std::uint32_t messageID, const CallMessage& message, PendingReply reply,
                         platform::UniqueFd descriptor) {
  if (auto problem = message.problem()) {
    failLater(std::move(reply), {std::move(*problem), CallErrorKind::refused});
    return;
  }
  const auto& outbox = _connection->outbox();
  const auto waiting = outbox->pending();
  std::optional<CallError> error;
  {
    const MutexLock lock(_mutex);
    if (_refusal) {
      error = _refusal;
    } else if (waiting > 0 && waiting + message.bytes().size() > _maximumWaitingBytes) {
      error = CallError{
          fmt::format("{} bytes of earlier calls wait for the daemon; the limit is {}", waiting, _maximumWaitingBytes),
          CallErrorKind::tooMuchWaiting};
    } else if (!std::holds_alternative<std::monostate>(reply) && !_pending.add(messageID, std::move(reply))) {
      error = CallError{"a call made four thousand million calls ago has not been answered yet",
                        CallErrorKind::tooMuchWaiting};
    }
  }
  if (error) {
    failLater(std::move(reply), std::move(*error));  // NOLINT(bugprone-use-after-move): add() takes it only on success
    return;
  }
  // When the outbox refuses the bytes, the connection is about to end, and that fails every unanswered call.
  if (descriptor) {
    outbox->sendWithDescriptor(message.bytes(), std::move(descriptor));
  } else {
    outbox->send(message.bytes());
  }
}

void CallChannel::failLater(PendingReply reply, CallError error) {
  if (std::holds_alternative<std::monostate>(reply)) return;
  _connection->queue()->post(
      [reply = std::move(reply), error = std::move(error)]() mutable { failReply(std::move(reply), error); });
}

void CallChannel::waitForRoom() {
  MutexLock lock(_mutex);
  while (!_refusal && _connection->outbox()->pending() > _maximumWaitingBytes) _progress.waitFor(lock, kRoomInterval);
}

void CallChannel::setHandlers(Handlers handlers) {
  auto fresh = handlers.aggregatedEvent || handlers.aggregationEnded
                   ? std::make_shared<const Handlers>(std::move(handlers))
                   : nullptr;
  const MutexLock lock(_mutex);
  _handlers.swap(fresh);
}

bool CallChannel::hasAggregationHandler() const {
  const MutexLock lock(_mutex);
  return _handlers != nullptr;
}

void CallChannel::expectAggregation() {
  const MutexLock lock(_mutex);
  _aggregationOver = false;
}

void CallChannel::setLostHandler(LostHandler handler) {
  const MutexLock lock(_mutex);
  if (!_lost) {
    _lostHandler = std::move(handler);
  } else if (handler) {
    _connection->queue()->post([handler = std::move(handler), reason = *_refusal] { handler(reason); });
  }
}

void CallChannel::close(std::chrono::milliseconds drain) {
  {
    const MutexLock lock(_mutex);
    if (std::exchange(_closing, true)) return;
    if (!_refusal) _refusal = CallError{"the program has closed the connection", CallErrorKind::connectionLost};
    _progress.notifyAll();
  }
  _connection->cancel(drain);
}

void CallChannel::waitUntilQuiet() {
  {
    MutexLock lock(_mutex);
    while (!_ended) _progress.wait(lock);
  }
  // The jobs posted to the callback thread before this one have run when it has.
  std::promise<void> reached;
  auto quiet = reached.get_future();
  _connection->queue()->post([reached = std::move(reached)]() mutable { reached.set_value(); });
  quiet.wait();
}

void CallChannel::abandon() {
  PendingReplies waiting;
  std::shared_ptr<const Handlers> handlers;
  LostHandler lostHandler;
  CallError reason;
  {
    const MutexLock lock(_mutex);
    std::swap(waiting, _pending);
    handlers.swap(_handlers);
    lostHandler.swap(_lostHandler);
    reason = _refusal.value_or(CallError{"the program has closed the connection", CallErrorKind::connectionLost});
  }
  waiting.failAll(reason);
}

bool CallChannel::isOpen() const {
  const MutexLock lock(_mutex);
  return !_refusal;
}

std::size_t CallChannel::unanswered() const {
  const MutexLock lock(_mutex);
  return _pending.size();
}

void CallChannel::received(Frame&& frame) {
  _heardAnything = true;
  switch (frame.kind) {
    case Frame::Kind::response: {
      PendingReply reply;
      {
        const MutexLock lock(_mutex);
        reply = _pending.take(frame.messageID);
      }
      _progress.notifyAll();
      deliverResponse(std::move(frame), std::move(reply));
      return;
    }
    case Frame::Kind::notification:
      receivedNotification(frame);
      return;
    case Frame::Kind::request:
      return;  // Today's daemon sends no requests; one of a later daemon stays unanswered.
  }
}

void CallChannel::receivedNotification(Frame& frame) {
  if (const auto token = decodeRemoveFile(frame)) {
    _uploads.removeFile(*token);
    return;
  }
  const auto event = decodeSendMessageToClient(frame);
  if (!event) return;
  std::shared_ptr<const Handlers> handlers;
  {
    const MutexLock lock(_mutex);
    if (_aggregationOver) return;
    _aggregationOver = event->isEndNotice();
    handlers = _handlers;
  }
  if (!handlers) return;
  if (!event->isEndNotice()) {
    if (handlers->aggregatedEvent) handlers->aggregatedEvent(*event);
  } else if (handlers->aggregationEnded) {
    handlers->aggregationEnded();
  }
}

void CallChannel::interrupted() {
  // A daemon that has shut down its sending side will not answer any more.
  _connection->cancel();
}

void CallChannel::invalidated(const std::optional<std::string>& protocolError) {
  PendingReplies waiting;
  LostHandler lostHandler;
  CallError reason;
  {
    const MutexLock lock(_mutex);
    if (!_refusal) _refusal = endReason(protocolError);
    reason = *_refusal;
    _ended = true;
    _lost = !_closing;
    std::swap(waiting, _pending);
    if (_lost) lostHandler.swap(_lostHandler);
    _progress.notifyAll();
  }
  _uploads.close(reason);
  waiting.failAll(reason);
  if (lostHandler) lostHandler(reason);
}

CallError CallChannel::endReason(const std::optional<std::string>& protocolError) const {
  if (protocolError) return {"the daemon broke the protocol: " + *protocolError, CallErrorKind::connectionLost};
  if (_heardAnything) return {"the daemon has closed the connection", CallErrorKind::connectionLost};
  return {
      fmt::format("the daemon closed the connection before it answered anything: is user {} granted {} by a file in "
                  "entitlements.d/ of the daemon's configuration directory?",
                  ::geteuid(), kOrvantaEntitlement),
      CallErrorKind::notEntitled};
}

}  // namespace orvanta
