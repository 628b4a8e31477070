#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/core/UniqueFd.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/FrameDecoder.h"
#include "platform/ipc/SocketOutbox.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

// The Connection over a socket.
//
// Reads on its queue, in turns: take what has arrived, carry out the frames in it one by one, write what they answered
// in one piece, wait for more. Bytes are read only when no whole frame is left, so that little piles up here and
// the socket's own buffer holds back a hasty peer. While it waits, the pending operation owns it.
class SocketConnection final : public Connection, public SocketOutbox::Observer {
 public:
  static std::shared_ptr<SocketConnection> create(WorkPool& pool, UniqueFd socket, ConnectionLimits limits);
  SocketConnection(WorkPool& pool, UniqueFd socket, ConnectionLimits limits);  // for create()
  ~SocketConnection() override;

  void resume(std::shared_ptr<ConnectionDelegate> delegate) override;
  void cancel(std::chrono::milliseconds drainReplies) override;
  void shutdownSending() override { _outbox->finish(); }
  const std::shared_ptr<Outbox>& outbox() const override { return _publicOutbox; }
  const std::shared_ptr<WorkQueue>& queue() const override { return _queue; }
  UniqueFd takeDescriptor() override;
  const std::string& description() const override { return _description; }
  void setDescription(std::string text) override { _description = std::move(text); }

  // Kept until this object goes, such as a place among the connections of one user. Before resume().
  void hold(std::shared_ptr<void> token) { _held = std::move(token); }

  void outboxEased() override;

 private:
  enum class Phase {
    fresh,       // not resumed
    open,        // reads and carries out
    halfClosed,  // the peer sends nothing more; replies still go out
    draining,    // over, but for replies that the peer is given time to take
    ended,
  };
  // Why a turn ended.
  enum class Pause { readable, turnUsedUp, repliesUnread, endOfInput, protocolError };

  // All of these on the queue.
  void begin(std::shared_ptr<ConnectionDelegate> delegate);
  void takeTurn();
  Pause carryOut();
  std::optional<Pause> carryOutFrames(int& carriedOut, std::chrono::steady_clock::time_point end);
  void readOnce();
  void eased();
  void inputEnded();
  void carryOutRest();
  void endAfterDrain(std::chrono::milliseconds timeout);
  void end();
  void later(void (SocketConnection::*step)());
  std::shared_ptr<SocketConnection> self() { return std::static_pointer_cast<SocketConnection>(shared_from_this()); }

  // Constant after construction, or set before resume().
  const ConnectionLimits _limits;
  const std::shared_ptr<WorkQueue> _queue;
  const std::shared_ptr<SocketOutbox> _outbox;
  const std::shared_ptr<Outbox> _publicOutbox;
  std::string _description;
  std::shared_ptr<void> _held;

  // Owned by the queue.
  UniqueFd _socket;
  Phase _phase = Phase::fresh;
  std::shared_ptr<ConnectionDelegate> _delegate;
  FrameDecoder _decoder;
  std::vector<UniqueFd> _descriptors;  // received, oldest first
  std::unique_ptr<DescriptorWatch> _watch;
  std::unique_ptr<Timer> _drainTimer;
  std::optional<std::string> _protocolError;
  bool _socketEmpty = false;  // the last read took all there was
  bool _endOfInput = false;
  bool _waitsForReplies = false;  // reading has stopped until the peer takes some
};

}  // namespace orvanta::platform
