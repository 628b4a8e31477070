#pragma once

#include <cstdint>
#include <utility>
#include <vector>

namespace orvanta {

// One datagram that waits for being sent again or for its acknowledgement. Owned by ReliableDelivery.
struct UDPPacketToSend {
  enum State : std::int32_t {
    kUnsent = 0,  // no transmission has succeeded yet
    kAwaitingAcknowledgement = 1
  };

  UDPPacketToSend(std::vector<std::uint8_t> bytes, std::uint16_t eventNum)
      : eventNumber(eventNum), data(std::move(bytes)) {}

  State state = kUnsent;
  std::int32_t numberOfChecks = 0;       // timer ticks since the last transmission
  std::int32_t numberOfRetransmits = 0;  // 0 to 4
  std::uint16_t eventNumber;
  std::vector<std::uint8_t> data;  // the whole datagram
};

}  // namespace orvanta
