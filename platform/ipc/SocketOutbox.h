#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <thread>
#include <vector>

#include "platform/core/Mutex.h"
#include "platform/core/UniqueFd.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/SocketIo.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

// The outbox of a SocketConnection, which makes it, keeps the socket open until close(), and hears of its progress.
//
// send() may be called on any thread. Bytes that the socket does not take at once wait here, and are written when the
// socket becomes writable: on a queue of its own, since the connection's may be busy for long.
//
// Its states, and what moves it:
//
//     open ---finish()---> finishing ---all written---> finished
//       |                      |
//       +---- a write fails ---+----> broken                   any state ---close()---> closed
//
// Only an open outbox takes messages. Finishing writes what waits and then shuts the sending side down. Once a write
// has failed the peer may have half a message, so that everything is dropped, waiting or new. Closed differs in that
// the descriptor is not touched any more: its number may soon belong to another socket.
//
// Beside that, one writer at a time: as a rule the sender writes at once, under the lock. When the socket takes no
// more, a job on _writerQueue waits for it (_waiting) and is the only one to write until nothing waits; senders then
// append only, which keeps messages in order. While a thread gathers (_gatherer), what it sends is appended, too, and
// written at the end of its batch.
class SocketOutbox final : public Outbox, public std::enable_shared_from_this<SocketOutbox> {
 public:
  // Above this, gathered messages are written before their batch ends.
  static constexpr std::size_t kGatherAtMost = 64U << 10U;

  class Observer {
   public:
    virtual ~Observer() = default;
    // No more than awaitAtMost()'s limit waits now, or a write has failed. On any thread, without locks held.
    virtual void outboxEased() = 0;
  };

  SocketOutbox(WorkPool& pool, int socket, std::size_t maximumDroppable);
  // Once, before the first send.
  void setObserver(std::weak_ptr<Observer> observer) { _observer = std::move(observer); }

  bool send(std::span<const std::uint8_t> message, Urgency urgency) override;
  bool sendWithDescriptor(std::span<const std::uint8_t> message, UniqueFd descriptor) override;
  std::size_t pending() const override { return _pending.load(std::memory_order_relaxed); }
  bool isClosed() const override;

  // Between the two, what the calling thread sends is gathered.
  void beginGathering();
  void endGathering();
  void writeGathered();

  bool broken() const;
  // Returns true when no more than `limit` bytes wait or a write has failed; otherwise the observer is told once that
  // is so.
  bool awaitAtMost(std::size_t limit);
  // Takes nothing more, and shuts down the sending side once all is written.
  void finish();
  // Takes nothing more, drops what waits; the socket is not touched afterwards.
  void close();

 private:
  enum class State { open, finishing, finished, broken, closed };
  // A descriptor that goes out with the byte at `begin`, in a call that sends nothing behind `end`; both count from the
  // first byte ever sent.
  struct Attachment {
    std::uint64_t begin;
    std::uint64_t end;
    UniqueFd descriptor;
  };
  bool append(std::span<const std::uint8_t> message, Urgency urgency, UniqueFd descriptor);
  // While a job waits for the socket to become writable, only that job writes; otherwise every caller does.
  bool mayWrite() const REQUIRES(_mutex) { return isUsable() && !_waiting; }
  bool isUsable() const REQUIRES(_mutex) { return _state == State::open || _state == State::finishing; }
  bool isGathering() const REQUIRES(_mutex) { return _gatherer == std::this_thread::get_id(); }
  std::size_t waitingBytes() const REQUIRES(_mutex) { return _bytes.size() - _start; }
  // Writes until nothing waits or the socket takes no more for now, as the result says.
  Sent::Kind writeWaiting() REQUIRES(_mutex);
  Sent writeSome() REQUIRES(_mutex);
  void keep(std::span<const std::uint8_t> rest) REQUIRES(_mutex);
  void dropFront(std::size_t count) REQUIRES(_mutex);
  void becomeUseless(State state) REQUIRES(_mutex);
  // Ends every operation: draws the consequences of the last write. The caller tells the returned observer, if any,
  // once it has released the lock.
  [[nodiscard]] std::shared_ptr<Observer> settle(Sent::Kind last) REQUIRES(_mutex);
  void startWaiting() REQUIRES(_mutex);

  // On _writerQueue only.
  void waitUntilWritable(const std::shared_ptr<void>& owner);
  void writeOn(const std::shared_ptr<void>& owner);
  void retryLater(const std::shared_ptr<void>& owner);
  void stopWaiting();

  // Constant after construction, or set before the first send.
  WorkPool& _pool;
  const std::size_t _maximumDroppable;
  std::weak_ptr<Observer> _observer;

  std::atomic<std::size_t> _pending{0};  // written under _mutex

  mutable Mutex _mutex;
  State _state GUARDED_BY(_mutex) = State::open;
  int _socket GUARDED_BY(_mutex);                       // the connection's; -1 once closed
  std::vector<std::uint8_t> _bytes GUARDED_BY(_mutex);  // from _start on: not yet taken by the socket
  std::size_t _start GUARDED_BY(_mutex) = 0;
  std::uint64_t _sent GUARDED_BY(_mutex) = 0;               // bytes that the socket has taken since the beginning
  std::vector<Attachment> _attachments GUARDED_BY(_mutex);  // in order
  std::thread::id _gatherer GUARDED_BY(_mutex);             // the thread whose messages are gathered
  std::optional<std::size_t> _awaited GUARDED_BY(_mutex);
  bool _waiting GUARDED_BY(_mutex) = false;  // a job waits for the socket to become writable

  // Made under _mutex when first needed, and never changed afterwards: its own jobs read it without the lock.
  std::shared_ptr<WorkQueue> _writerQueue;

  // Owned by _writerQueue. The watch has a descriptor of its own: once watched for writing, a descriptor reports
  // whenever its peer reads, and the connection's should not; it lives only while something waits.
  struct Writer {
    UniqueFd socket;
    std::unique_ptr<DescriptorWatch> watch;
    std::unique_ptr<Timer> retry;
  };
  Writer _writer;
};

}  // namespace orvanta::platform
