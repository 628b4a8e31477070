#include "tools/orvantactl/FlushVerdict.h"

#include <fmt/format.h>

#include <utility>

#include "interface/Values.h"
#include "platform/codec/Json.h"

namespace orvanta::ctl {

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

}  // namespace orvanta::ctl
