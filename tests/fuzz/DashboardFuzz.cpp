#include <algorithm>
#include <string>

#include "backends/dashboard/DashboardDatagram.h"
#include "backends/dashboard/ReliableDelivery.h"
#include "platform/core/Utf8.h"
#include "tests/fuzz/Require.h"

namespace {

using namespace orvanta;

using Bytes = std::span<const std::uint8_t>;

void takeApart(Bytes datagram) {
  const auto line = writeLocalLog(datagram);
  if (line) REQUIRE(line->size() <= kDashboardMaximumLogLine && platform::isValidUtf8(*line));
  const auto packet = decodeDashboardDatagram(datagram);
  if (!packet) {
    REQUIRE(!packet.error().empty());
    return;
  }
  REQUIRE(packet->text.size() + kDashboardHeaderBytes == datagram.size());
  const auto pairs = parseDashboardText(packet->text);
  std::size_t length = 0;
  for (const auto& [key, value] : pairs) length += key.size() + 1 + value.size();
  REQUIRE(length <= 2 * packet->text.size());  // without a space before it a key is the end of a value, too

  // A datagram that was read and written again means the same.
  Dictionary payload;
  for (const auto& [key, value] : pairs) {
    if (platform::isValidUtf8(key) && platform::isValidUtf8(value)) payload.set(key, value);
  }
  DashboardSender sender;
  sender.clientType = packet->header.clientType;
  sender.sessionID = packet->header.sessionID();
  sender.deviceID = packet->header.deviceIDText();
  const auto& header = packet->header;
  const auto again =
      decodeDashboardDatagram(encodeDashboardDatagram(sender, {std::make_shared<const Dictionary>(payload),
                                                               {static_cast<std::int32_t>(header.timeSeconds), 0},
                                                               header.method,
                                                               header.respCode,
                                                               EventFlag::none,
                                                               7}));
  REQUIRE(again && again->text.size() <= kDashboardMaximumText);
  REQUIRE(again->header.sessionID() == header.sessionID() && again->header.method == header.method);
  REQUIRE(again->header.deviceIDText() == header.deviceIDText());
}

// Each two bytes are an event, a tick or an acknowledgement.
void deliver(Bytes script) {
  ReliableDelivery delivery;
  if (!script.empty() && (script[0] & 1U) != 0) delivery.useAcknowledgements();
  std::uint16_t next = 0;
  for (; script.size() >= 2; script = script.subspan(2)) {
    const std::size_t before = delivery.messageQueue().size();
    const bool works = (script[1] & 1U) != 0;
    switch (script[0] % 3) {
      case 0:
        delivery.sent({script[1]}, next++, works);
        REQUIRE(delivery.messageQueue().size() <= ReliableDelivery::kCapacity);
        break;
      case 1: {
        std::size_t sends = 0;
        delivery.tick([&](Bytes datagram) {
          REQUIRE(datagram.size() == 1);
          ++sends;
          return works;
        });
        REQUIRE(sends <= before && delivery.messageQueue().size() <= before);
        break;
      }
      default:
        const bool found = delivery.acknowledged(script[1]);
        REQUIRE(delivery.messageQueue().size() == before - (found ? 1 : 0));
    }
    for (const auto& packet : delivery.messageQueue()) {
      REQUIRE(packet.numberOfRetransmits >= 0 && packet.numberOfRetransmits <= 4);
    }
  }
  // A silent server always ends it in bounded time.
  for (int tick = 0; tick < 100; ++tick) delivery.tick([](Bytes) { return true; });
  REQUIRE(delivery.empty());
}

}  // namespace

// The first byte says what the rest is: a datagram as it stands, a datagram's text behind a good header, or the course
// of a delivery.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  if (size == 0) return 0;
  const Bytes rest(bytes + 1, size - 1);
  switch (bytes[0] % 3) {
    case 0:
      takeApart(rest);
      break;
    case 1: {
      auto datagram = encodeDashboardDatagram({}, {.category = 1, .type = 2, .number = 3});
      const auto length = static_cast<std::uint16_t>(std::min<std::size_t>(datagram.size() + rest.size(), 0xffff));
      datagram.insert(datagram.end(), rest.begin(), rest.begin() + (length - kDashboardHeaderBytes));
      datagram[14] = static_cast<std::uint8_t>(~length >> 8);
      datagram[15] = static_cast<std::uint8_t>(~length);
      REQUIRE(decodeDashboardDatagram(datagram));
      takeApart(datagram);
      break;
    }
    default:
      deliver(rest);
  }
  return 0;
}
