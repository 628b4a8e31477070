#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>

#include "backends/Event.h"
#include "interface/ClientSessionInterface.h"
#include "interface/Values.h"
#include "platform/core/Mutex.h"
#include "platform/ipc/Connection.h"

namespace orvanta {

// The client at the other end of a connection, as the daemon calls it. Never blocks: messages that the client has not
// read wait in its outbox, up to the outbox's limit; events over that are dropped and counted in the log. One thread at
// a time.
class ClientReplyProxy final : public ClientSessionReplyInterface {
 public:
  explicit ClientReplyProxy(std::shared_ptr<platform::Outbox> outbox) : _outbox(std::move(outbox)) {}

  void sendMessageToClient(const SharedDictionary& sessionInfo, double timestamp, std::uint16_t category,
                           std::uint16_t type, const SharedDictionary& payload) override;

 private:
  const std::shared_ptr<platform::Outbox> _outbox;
  std::uint64_t _dropped = 0;  // since the client last kept up
};

// Knows whether a session's client aggregates, and sends it events. Its lock is a leaf: an event or the end notice goes
// into the client's outbox together with the test or change of hasAggregator(), so that no event follows the notice and
// only one is sent.
//
// Owned by its session. Any thread: events come from the queues of the session and of the sessions below it.
class Aggregation {
 public:
  // Without an outbox nothing is sent.
  explicit Aggregation(std::shared_ptr<platform::Outbox> outbox);

  bool hasAggregator() const { return _hasAggregator.load(std::memory_order_acquire); }
  void setHasAggregator(bool hasAggregator);
  // Returns whether the event was handed to the client: not when its aggregation has ended meanwhile.
  bool send(const SharedDictionary& sessionInfo, const Event& event);
  // Sends the end notice to a client that still aggregates.
  void shutdown();

 private:
  platform::Mutex _lock;
  std::optional<ClientReplyProxy> _client GUARDED_BY(_lock);
  std::atomic<bool> _hasAggregator{false};  // written under _lock
};

}  // namespace orvanta
