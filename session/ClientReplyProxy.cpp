#include "session/ClientReplyProxy.h"

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

void ClientReplyProxy::removeFile(std::string_view token) {
  _outbox->send(encodeRemoveFile(token));
}

}  // namespace orvanta
