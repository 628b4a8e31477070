#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "platform/core/UniqueFd.h"
#include "platform/ipc/FrameDecoder.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

// Bytes, and a number of descriptors; nothing unless set.
struct ConnectionLimits {
  FrameLimits frame;
  std::size_t maximumUnreadReplies = 0;       // above this nothing more is read from the peer
  std::size_t maximumDroppable = 0;           // above this droppable messages are dropped
  std::size_t maximumWaitingDescriptors = 0;  // above this: protocol error
};

// The sending half of a connection. Shared by the connection and, weakly, by reply handles; outlives neither's need.
// Thread-safe: any thread may send at any time, and messages go out whole and in the order of the calls.
class Outbox {
 public:
  virtual ~Outbox() = default;

  enum class Urgency { reply, droppable };
  // Appends one whole encoded message and writes it as soon as the socket takes it. On the connection's own queue,
  // while it carries out calls, messages are gathered and written together at the end of the batch or when the thread
  // is about to block. Returns false when the message was dropped: the peer has gone, or a droppable message would
  // exceed the limit.
  virtual bool send(std::span<const std::uint8_t> message, Urgency urgency = Urgency::reply) = 0;
  // The same with one descriptor that travels with the first byte of the message.
  virtual bool sendWithDescriptor(std::span<const std::uint8_t> message, UniqueFd descriptor) = 0;
  // Bytes not yet taken by the socket.
  virtual std::size_t pending() const = 0;
  // Returns whether the peer has gone, so that every message is dropped from now on.
  virtual bool isClosed() const = 0;
};

// The events of a connection, for its owner. Every call comes on the connection's queue, one at a time, and none after
// invalidated().
class ConnectionDelegate {
 public:
  virtual ~ConnectionDelegate() = default;
  // One whole frame, in the order of arrival. Descriptors that came with it wait in takeDescriptor().
  virtual void received(Frame&& frame) = 0;
  // The peer will send nothing more, but still reads (it shut down its sending side). At most once.
  virtual void interrupted() = 0;
  // The connection has ended: closed by the peer, reset, cancelled here, or broken by a protocol error, whose text
  // comes along. Exactly once, as the last job of the connection; what had arrived whole was delivered before.
  virtual void invalidated(const std::optional<std::string>& protocolError) = 0;
};

// One end of a connected Unix stream socket that carries MessagePack-RPC frames. See docs/protocol.md.
//
// Made with create(), inert until resume(). Holds its delegate strongly from resume() to invalidated(), after which it
// releases it. Frames are decoded one at a time as they are carried out, at most `kFramesPerTurn` before other queues
// get their turn.
class Connection : public std::enable_shared_from_this<Connection> {
 public:
  static std::shared_ptr<Connection> create(WorkPool& pool, UniqueFd socket, ConnectionLimits limits);
  virtual ~Connection() = default;

  // Once.
  virtual void resume(std::shared_ptr<ConnectionDelegate> delegate) = 0;
  // Ends the connection as if the peer had closed it; invalidated() follows on the queue. Any thread; idempotent.
  // `drainReplies`: first gives what is waiting in the outbox up to this long to be taken by the peer.
  virtual void cancel(std::chrono::milliseconds drainReplies = std::chrono::milliseconds(0)) = 0;
  // Sends nothing more: what waits still goes out, then the peer sees an end of file. Reading goes on. Any thread.
  virtual void shutdownSending() = 0;

  virtual const std::shared_ptr<Outbox>& outbox() const = 0;
  virtual const std::shared_ptr<WorkQueue>& queue() const = 0;
  // The oldest descriptor received and not yet taken; empty when all are taken. On the queue only.
  virtual UniqueFd takeDescriptor() = 0;
  // For log lines, such as "fd 7 (pid 1234, uid 1000)"; set by the listener before resume().
  virtual const std::string& description() const = 0;
  virtual void setDescription(std::string text) = 0;

  static constexpr int kFramesPerTurn = 256;
};

}  // namespace orvanta::platform
