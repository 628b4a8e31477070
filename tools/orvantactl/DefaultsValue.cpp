#include "tools/orvantactl/DefaultsValue.h"

#include <charconv>
#include <cmath>
#include <cstdint>
#include <string_view>
#include <system_error>

#include "platform/codec/PropertyList.h"
#include "tools/orvantactl/JsonValues.h"

namespace orvanta::ctl {

namespace {

template <class Number>
bool parseWhole(std::string_view text, Number& out) {
  const auto result = std::from_chars(text.data(), text.data() + text.size(), out);
  return result.ec == std::errc() && result.ptr == text.data() + text.size();
}

Result<Value> valueOf(const std::string& text, const std::string& type) {
  if (type == "string") return Value(text);
  if (type == "int") {
    std::int64_t number = 0;
    if (!parseWhole(text, number)) return Failure{"'" + text + "' is no whole number"};
    return Value(number);
  }
  if (type == "float") {
    double number = 0;
    if (!parseWhole(text, number) || !std::isfinite(number)) return Failure{"'" + text + "' is no number"};
    return Value(number);
  }
  if (type == "bool") {
    if (text == "true" || text == "yes" || text == "1") return Value(true);
    if (text == "false" || text == "no" || text == "0") return Value(false);
    return Failure{"'" + text + "' is neither true nor false"};
  }
  if (type == "json") {
    auto parsed = parseTaggedJson(text);
    if (parsed && parsed->isNull()) return Failure{"null is no value; use 'defaults delete' to remove a key"};
    return parsed;
  }
  return Failure{"'" + type + "' is no type; there are string, int, float, bool and json"};
}

}  // namespace

Result<Value> parseDefaultsValue(const std::string& text, const std::string& type) {
  auto value = valueOf(text, type);
  if (!value) return value;
  // As it will be stored: null inside, say, has no form there.
  const auto written = platform::writeXmlPropertyList(*value);
  if (!written) return Failure{"the value cannot be stored: " + written.error()};
  return value;
}

std::string showDefaultsValue(const Value& value) {
  if (const auto* text = value.string()) return *text;
  return writeTaggedJson(value);
}

}  // namespace orvanta::ctl
