#include "backends/VoltmarkBackend.h"

namespace orvanta {

namespace {

constexpr std::int32_t kRegisteredEvent = 28;
constexpr std::string_view kSender = "Vesperd-ORV";

}  // namespace

std::optional<std::string> VoltmarkBackend::sendMessage(const SharedDictionary& payload,
                                                        platform::TimeValue /*timestamp*/, std::uint16_t method,
                                                        std::uint16_t respCode, std::uint16_t eventID,
                                                        std::int32_t /*flag*/) {
  if (method == 0 || !payload || payload->empty()) return std::nullopt;
  Dictionary record = *payload;
  record.set("method", static_cast<unsigned>(method));
  record.set("respCode", static_cast<unsigned>(respCode));
  record.set("event", static_cast<unsigned>(eventID));
  platform().powerLog().registeredEvent(kRegisteredEvent, kSender, record);
  return std::nullopt;
}

}  // namespace orvanta
