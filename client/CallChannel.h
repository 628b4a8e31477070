#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "client/CallMessage.h"
#include "client/CallbackThread.h"
#include "client/UploadTokens.h"
#include "interface/RemoteCalls.h"
#include "platform/core/Mutex.h"
#include "platform/core/UniqueFd.h"
#include "platform/ipc/Connection.h"

namespace orvanta {

// The calls of one connection that have not been answered, by message id: the channel adds one before its bytes go out,
// and takes it when the response comes or fails all when the connection ends. Not thread-safe: the channel locks.
class PendingReplies {
 public:
  // Returns false, and leaves the reply alone, when the id is in use.
  bool add(std::uint32_t messageID, PendingReply&& reply);
  // Returns monostate for an id under which no reply waits.
  PendingReply take(std::uint32_t messageID);
  // Fails all of them, in the order of their ids.
  void failAll(const CallError& error);
  std::size_t size() const { return _replies.size(); }

 private:
  std::map<std::uint32_t, PendingReply> _replies;
};

// The client's end of one connection: sends calls, brings each its answer exactly once, and passes the daemon's
// notifications on.
//
// Shared by the OrvantaConnection, its session, and, until it has ended, the platform's connection. Calls may be made
// on any thread; replies and handlers are called on the callback thread, one at a time.
//
//   open ──close()──► closing ──┐
//     └───────────────────────► ended (invalidated(): lost, unless close() came first)
//
// From the first step away from open every new call fails with _refusal; in the second every unanswered one does.
class CallChannel final : public platform::ConnectionDelegate, public std::enable_shared_from_this<CallChannel> {
 public:
  struct Handlers {
    std::function<void(const AggregatedEvent&)> aggregatedEvent;
    std::function<void()> aggregationEnded;
  };
  using LostHandler = std::function<void(const CallError&)>;

  // The thread outlives the channel.
  CallChannel(std::shared_ptr<platform::Connection> connection, const CallbackThread& thread,
              std::size_t maximumWaitingBytes);
  CallChannel(const CallChannel&) = delete;
  CallChannel& operator=(const CallChannel&) = delete;
  ~CallChannel() override;

  // Once, before the first call.
  void start();

  std::uint32_t nextMessageID() { return _nextMessageID++; }
  // Sends a call that was made under `messageID`. If it cannot be sent, its reply fails, on the callback thread too.
  void submit(std::uint32_t messageID, const CallMessage& message, PendingReply reply,
              platform::UniqueFd descriptor = {});
  // Fails a reply on the callback thread, for a call that never came to be sent.
  void failLater(PendingReply reply, CallError error);

  // For callers that may block: waits while more bytes than the limit wait to be sent. Returns at once when the
  // connection has ended. Not on the callback thread.
  void waitForRoom();

  // Replaces the handlers; empty functions remove them. An event already being delivered may still reach the earlier
  // one.
  void setHandlers(Handlers handlers);
  bool hasAggregationHandler() const;
  // A session may be configured anew after aggregation has ended: then events count again.
  void expectAggregation();
  // Called once when the connection ends without close(), or now if it has.
  void setLostHandler(LostHandler handler);

  // Ends the connection; the daemon gets up to `drain` to read the calls already sent. Idempotent.
  void close(std::chrono::milliseconds drain);
  // After close(): waits until the connection has ended and the last callback has run. Not on the callback thread.
  void waitUntilQuiet();
  // Drops all handlers and fails all unanswered calls on the spot: for an owner that is destroyed on the callback
  // thread.
  void abandon();
  bool isOpen() const;

  UploadTokens& uploads() { return _uploads; }
  const CallbackThread& thread() const { return _thread; }
  // The number of unanswered calls.
  std::size_t unanswered() const;

  void received(platform::Frame&& frame) override;
  void interrupted() override;
  void invalidated(const std::optional<std::string>& protocolError) override;

 private:
  CallError endReason(const std::optional<std::string>& protocolError) const;
  void receivedNotification(platform::Frame& frame);

  // Constant after construction.
  const std::shared_ptr<platform::Connection> _connection;
  const CallbackThread& _thread;
  const std::size_t _maximumWaitingBytes;

  std::atomic<std::uint32_t> _nextMessageID{1};
  UploadTokens _uploads;  // locks by itself

  // Owned by the callback thread.
  bool _heardAnything = false;

  mutable platform::Mutex _mutex;
  platform::Condition _progress;  // an answer came, or the connection ended
  PendingReplies _pending GUARDED_BY(_mutex);
  std::shared_ptr<const Handlers> _handlers GUARDED_BY(_mutex);  // null while not set
  LostHandler _lostHandler GUARDED_BY(_mutex);
  bool _aggregationOver GUARDED_BY(_mutex) = false;      // the end notice came
  bool _closing GUARDED_BY(_mutex) = false;              // close() was called
  bool _ended GUARDED_BY(_mutex) = false;                // invalidated() came
  bool _lost GUARDED_BY(_mutex) = false;                 // it came without close()
  std::optional<CallError> _refusal GUARDED_BY(_mutex);  // why no call is taken any more; nullopt while open
};

}  // namespace orvanta
