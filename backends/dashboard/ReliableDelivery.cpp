#include "backends/dashboard/ReliableDelivery.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace orvanta {

void ReliableDelivery::sent(std::vector<std::uint8_t> datagram, std::uint16_t eventNumber, bool whole) {
  if (whole && !_acknowledged) return;
  UDPPacketToSend& packet = _messageQueue.emplace_back(std::move(datagram), eventNumber);
  if (whole) packet.state = UDPPacketToSend::kAwaitingAcknowledgement;
  if (_messageQueue.size() > kCapacity) _messageQueue.erase(_messageQueue.begin());
}

void ReliableDelivery::tick(const Send& send) {
  for (auto packet = _messageQueue.begin(); packet != _messageQueue.end();) {
    const Verdict verdict =
        packet->state == UDPPacketToSend::kUnsent ? checkUnsent(*packet, send) : checkAwaiting(*packet, send);
    packet = verdict == Verdict::remove ? _messageQueue.erase(packet) : std::next(packet);
  }
}

bool ReliableDelivery::acknowledged(std::uint16_t eventNumber) {
  const auto found = std::find_if(_messageQueue.begin(), _messageQueue.end(),
                                  [&](const UDPPacketToSend& packet) { return packet.eventNumber == eventNumber; });
  if (found == _messageQueue.end()) return false;
  _messageQueue.erase(found);
  return true;
}

ReliableDelivery::Verdict ReliableDelivery::checkUnsent(UDPPacketToSend& packet, const Send& send) const {
  if (!send(packet.data)) return Verdict::keep;
  if (!_acknowledged) return Verdict::remove;
  packet.state = UDPPacketToSend::kAwaitingAcknowledgement;
  return Verdict::keep;
}

ReliableDelivery::Verdict ReliableDelivery::checkAwaiting(UDPPacketToSend& packet, const Send& send) {
  const auto retransmits = static_cast<std::size_t>(packet.numberOfRetransmits);
  if (retransmits >= kTicksBeforeRetransmission.size()) return Verdict::remove;
  const std::int32_t checks = packet.numberOfChecks + 1;
  if (checks < kTicksBeforeRetransmission[retransmits]) {
    packet.numberOfChecks = checks;
  } else if (send(packet.data)) {
    packet.numberOfChecks = 0;
    ++packet.numberOfRetransmits;
  }
  return Verdict::keep;
}

}  // namespace orvanta
