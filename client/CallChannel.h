#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "client/CallMessage.h"
#include "client/CallbackThread.h"
#include "client/PendingReplies.h"
#include "client/UploadTokens.h"
#include "interface/ClientSessionInterface.h"
#include "platform/core/UniqueFd.h"
#include "platform/ipc/Connection.h"

namespace orvanta {

// The client's end of one connection: sends calls, brings each its answer exactly once, and passes on what the daemon
// says of its own accord.
//
// Shared by the OrvantaConnection, its session, and, until it has ended, the platform's connection. Calls may be made
// on any thread; replies and handlers are called on the callback thread, one at a time. When the connection ends, every
// call not answered fails with the reason, and so does every later one.
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
  // Sends a call that was made under `messageID`. What cannot be sent fails its reply, on the callback thread too.
  void submit(std::uint32_t messageID, const CallMessage& message, PendingReply reply,
              platform::UniqueFd descriptor = {});
  // Fails a reply on the callback thread, for a call that never came to be sent.
  void failLater(PendingReply reply, CallError error);

  // For callers that may block: waits while the limit on waiting bytes is exceeded. Returns at once when the connection
  // has ended. Not on the callback thread.
  void waitForRoom();

  // Called from now on; empty functions end that. An event already being delivered may still come to the earlier one.
  void setHandlers(Handlers handlers);
  bool hasAggregationHandler() const;
  // A session may be configured anew after aggregation has ended: then events count again.
  void expectAggregation();
  // Called once when the connection ends without close(), or now if it has.
  void setLostHandler(LostHandler handler);

  // Ends the connection; what has been sent gets up to `drain` to be taken by the daemon. Idempotent.
  void close(std::chrono::milliseconds drain);
  // Waits until the connection has ended after close() and nothing will be called any more. Not on the callback thread.
  void waitUntilQuiet();
  // Drops all handlers and fails what waits, here and now: for an owner that goes away on the callback thread itself.
  void abandon();
  bool isOpen() const;

  UploadTokens& uploads() { return _uploads; }
  const CallbackThread& thread() const { return _thread; }
  // How many calls have not been answered.
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
  UploadTokens _uploads;

  bool _heardAnything = false;  // touched on the callback thread only

  mutable std::mutex _mutex;
  std::condition_variable _progress;          // an answer came, or the connection ended
  PendingReplies _pending;                    // guarded by _mutex
  std::shared_ptr<const Handlers> _handlers;  // guarded by _mutex; null: none
  LostHandler _lostHandler;                   // guarded by _mutex
  bool _aggregationOver = false;              // guarded by _mutex: the end notice came
  bool _closing = false;                      // guarded by _mutex: close() was called
  bool _ended = false;                        // guarded by _mutex: invalidated() came
  bool _lost = false;                         // guarded by _mutex: it came without close()
  std::optional<CallError> _refusal;          // guarded by _mutex: why no call is taken any more
};

}  // namespace orvanta
