#include "tools/orvantactl/AnswerLines.h"

#include <fmt/format.h>

#include <utility>

#include "interface/Values.h"
#include "platform/codec/Json.h"
#include "tools/orvantactl/JsonValues.h"

namespace orvanta::ctl {

std::string optionalJson(const std::optional<std::string>& text) {
  if (!text) return "null";
  std::string json;
  platform::appendJsonString(json, *text);
  return json;
}

std::string answerLine(std::uint64_t line, const StringReply::Outcome& outcome) {
  if (!outcome.values) return fmt::format("{{\"event\":{},\"error\":{}}}", line, optionalJson(outcome.error.text));
  return fmt::format("{{\"event\":{},\"reply\":{}}}", line, optionalJson(std::get<0>(*outcome.values)));
}

std::string flushLine(const FlushAnswer& answer) {
  Dictionary flush{{"result", answer.text ? Value(*answer.text) : Value()}, {"error", Value()}};
  if (answer.error) {
    flush.set("error", Dictionary{{"code", answer.error->code}, {"description", answer.error->description}});
  }
  return platform::writeJson(Dictionary{{"flush", std::move(flush)}});
}

std::optional<std::string> flushProblem(const FlushAnswer& answer) {
  if (!answer.error || answer.error->description.starts_with("Nothing to flush")) return std::nullopt;
  auto text = fmt::format("the flush failed: {} (code {})", answer.error->description, answer.error->code);
  if (answer.error->description.find("userInfo is required") != std::string::npos) {
    text += "; give --client-name and --service-name";
  }
  return text;
}

std::string watchingLine(const std::string& token, std::uint32_t level) {
  return platform::writeJson(Dictionary{{"watching", Dictionary{{"token", token}, {"level", level}}}});
}

std::string aggregatedEventLine(const AggregatedEvent& event) {
  const auto json = [](const SharedDictionary& dictionary) {
    return dictionary ? writeTaggedJson(Value(*dictionary)) : "null";
  };
  std::string timestamp;
  if (!platform::appendJsonNumber(timestamp, event.timestamp)) timestamp = "null";
  return fmt::format("{{\"timestamp\":{},\"category\":{},\"type\":{},\"payload\":{},\"session\":{}}}", timestamp,
                     event.category, event.type, json(event.payload), json(event.sessionInfo));
}

}  // namespace orvanta::ctl
