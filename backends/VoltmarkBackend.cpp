#include "backends/VoltmarkBackend.h"

namespace orvanta {

namespace {

constexpr std::int32_t kRegisteredEvent = 28;
constexpr std::string_view kSender = "Vesperd-ORV";

}  // namespace

std::optional<std::string> VoltmarkBackend::sendNumbered(const Event& event) {
  if (event.category == 0 || !event.payload || event.payload->empty()) return std::nullopt;
  Dictionary record = *event.payload;
  record.set("method", static_cast<unsigned>(event.category));
  record.set("respCode", static_cast<unsigned>(event.type));
  record.set("event", static_cast<unsigned>(event.number));
  platform().powerLog().registeredEvent(kRegisteredEvent, kSender, record);
  return std::nullopt;
}

}  // namespace orvanta
