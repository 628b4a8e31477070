#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <span>
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

// Decides which datagrams are kept, when they are sent again and when they are given up: the bookkeeping of delivery
// over UDP, without a socket or a clock.
//
// Plain delivery keeps only what could not be sent, until it can. Acknowledged delivery keeps every datagram until its
// event number is acknowledged or its four retransmissions are used up:
//
//     sent ──┬─ 2 ticks ─ resent ─ 3 ─ resent ─ 5 ─ resent ─ 9 ─ resent ─ 1 ─ given up
//            └─ acknowledged at any time: gone
//
// Owned by one DashboardBackend and used on its network queue only. Nothing here fails.
class ReliableDelivery {
 public:
  // Sends a datagram and returns whether the whole of it went out.
  using Send = std::function<bool(std::span<const std::uint8_t>)>;

  static constexpr std::size_t kCapacity = 50;  // one more drops the oldest
  static constexpr std::array<std::int32_t, 4> kTicksBeforeRetransmission{2, 3, 5, 9};

  void useAcknowledgements() { _acknowledged = true; }

  // A datagram has had its first transmission: `whole` says whether it went out.
  void sent(std::vector<std::uint8_t> datagram, std::uint16_t eventNumber, bool whole);
  // One period of the timer has passed.
  void tick(const Send& send);
  // Forgets the oldest datagram with that number. Returns whether there was one.
  bool acknowledged(std::uint16_t eventNumber);

  bool empty() const { return _messageQueue.empty(); }
  void clear() { _messageQueue.clear(); }
  const std::vector<UDPPacketToSend>& messageQueue() const { return _messageQueue; }

 private:
  enum class Verdict { keep, remove };
  Verdict checkUnsent(UDPPacketToSend& packet, const Send& send) const;
  static Verdict checkAwaiting(UDPPacketToSend& packet, const Send& send);

  bool _acknowledged = false;
  std::vector<UDPPacketToSend> _messageQueue;  // oldest first
};

}  // namespace orvanta
