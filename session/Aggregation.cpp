#include "session/Aggregation.h"

#include "config/Conversions.h"
#include "interface/OrvantaLogging.h"
#include "interface/RemoteCalls.h"

namespace orvanta {

void ClientReplyProxy::sendMessageToClient(const SharedDictionary& sessionInfo, double timestamp,
                                           std::uint16_t category, std::uint16_t type,
                                           const SharedDictionary& payload) {
  const auto message = encodeSendMessageToClient(sessionInfo, timestamp, category, type, payload);
  const bool isEndNotice = !sessionInfo;
  const auto urgency = isEndNotice ? platform::Outbox::Urgency::reply : platform::Outbox::Urgency::droppable;
  if (_outbox->send(message, urgency)) {
    if (_dropped > 0) {
      ORVANTA_LOG(notice, "sendMessageToClient: The client reads again; {} aggregated events were dropped", _dropped);
      _dropped = 0;
    }
    return;
  }
  if (_outbox->isClosed()) {
    ORVANTA_LOG(error, "sendMessageWithDictionary: Failed to get remote object proxy: {}", "the connection is closed");
    return;
  }
  // One line when it begins and one when it ends, however many events there are between.
  if (_dropped++ == 0) {
    ORVANTA_LOG(warning,
                "sendMessageToClient: Dropping aggregated events: {} bytes wait for a client that does not read",
                _outbox->pending());
  }
}

Aggregation::Aggregation(std::shared_ptr<platform::Outbox> outbox) {
  if (outbox) _client.emplace(std::move(outbox));
}

void Aggregation::setHasAggregator(bool hasAggregator) {
  const platform::MutexLock lock(_lock);
  _hasAggregator.store(hasAggregator, std::memory_order_release);
}

bool Aggregation::send(const SharedDictionary& sessionInfo, const Event& event) {
  const platform::MutexLock lock(_lock);
  if (!hasAggregator() || !_client) return false;
  _client->sendMessageToClient(sessionInfo, timevalToSeconds(event.time), event.category, event.type, event.payload);
  return true;
}

void Aggregation::shutdown() {
  const platform::MutexLock lock(_lock);
  if (hasAggregator() && _client) _client->sendMessageToClient(nullptr, 0.0, 0, 0, nullptr);
  _hasAggregator.store(false, std::memory_order_release);
}

}  // namespace orvanta
