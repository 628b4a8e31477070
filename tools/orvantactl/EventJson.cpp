#include "tools/orvantactl/EventJson.h"

#include <fmt/format.h>

#include "platform/codec/Json.h"
#include "tools/orvantactl/JsonValues.h"

namespace orvanta::ctl {

std::string aggregatedEventLine(const AggregatedEvent& event) {
  const auto json = [](const SharedDictionary& dictionary) {
    return dictionary ? writeTaggedJson(Value(*dictionary)) : "null";
  };
  std::string timestamp;
  if (!platform::appendJsonNumber(timestamp, event.timestamp)) timestamp = "null";
  return fmt::format("{{\"timestamp\":{},\"category\":{},\"type\":{},\"payload\":{},\"session\":{}}}", timestamp,
                     event.category, event.type, json(event.payload), json(event.sessionInfo));
}

std::string watchingLine(const std::string& token, std::uint32_t level) {
  return platform::writeJson(Dictionary{{"watching", Dictionary{{"token", token}, {"level", level}}}});
}

}  // namespace orvanta::ctl
