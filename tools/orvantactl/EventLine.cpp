#include "tools/orvantactl/EventLine.h"

#include <fmt/format.h>

#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <utility>
#include <variant>

#include "interface/OrvantaConstants.h"
#include "tools/orvantactl/JsonValues.h"

namespace orvanta::ctl {

namespace {

constexpr std::string_view kRealtime = "realtime";
constexpr std::string_view kPromote = "promote";

template <class Number>
std::optional<std::string> readNumber(const Value& value, std::string_view key, Number& out) {
  constexpr auto kLargest = std::numeric_limits<Number>::max();
  const auto* number = std::get_if<std::int64_t>(&value.storage());
  if (number == nullptr || *number < 0 || *number > kLargest) {
    return fmt::format("\"{}\" must be a whole number from 0 to {}", key, kLargest);
  }
  out = static_cast<Number>(*number);
  return std::nullopt;
}

std::optional<std::string> readFlag(const Value& value, std::string_view key, bool& out) {
  if (!value.isBool()) return fmt::format("\"{}\" must be true or false", key);
  out = value.boolValue();
  return std::nullopt;
}

std::optional<std::string> readPayload(Value& value, std::optional<Dictionary>& out) {
  if (value.isNull()) return std::nullopt;
  auto* payload = value.dictionary();
  if (payload == nullptr) return "\"payload\" must be an object";
  out = std::move(*payload);
  return std::nullopt;
}

// Takes one entry of the line. Returns what is wrong with it, or nullopt.
std::optional<std::string> readEntry(const std::string& key, Value& value, MessageParameters& event) {
  if (key == kOrvantaMessageParametersCategory) return readNumber(value, key, event.category);
  if (key == kOrvantaMessageParametersType) return readNumber(value, key, event.type);
  if (key == kOrvantaMessageParametersPayload) return readPayload(value, event.payload);
  if (key == kOrvantaMessageParametersFlag) return readNumber(value, key, event.flag);
  if (key == kRealtime) return readFlag(value, key, event.realtime);
  if (key == kPromote) return readFlag(value, key, event.promote);
  return fmt::format("\"{}\" is not a key of an event; there are category, type, payload, flag, realtime and promote",
                     key);
}

}  // namespace

Result<MessageParameters> parseEventLine(std::string_view line, const EventDefaults& defaults) {
  auto parsed = parseTaggedJson(line);
  if (!parsed) return Failure{parsed.error()};
  auto* object = parsed->dictionary();
  if (object == nullptr) return Failure{"not a JSON object such as {\"category\": 1, \"type\": 2}"};
  for (const auto key : {kOrvantaMessageParametersCategory, kOrvantaMessageParametersType}) {
    if (!object->contains(key)) return Failure{fmt::format("\"{}\" is missing", key)};
  }
  MessageParameters event;
  event.realtime = defaults.realtime;
  event.promote = defaults.promote;
  for (auto& [key, value] : *object) {
    if (auto problem = readEntry(key, value, event)) return Failure{std::move(*problem)};
  }
  return event;
}

}  // namespace orvanta::ctl
