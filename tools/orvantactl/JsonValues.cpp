#include "tools/orvantactl/JsonValues.h"

#include <charconv>
#include <cmath>
#include <cstdint>
#include <optional>
#include <system_error>
#include <utility>

#include "platform/codec/Json.h"
#include "platform/codec/PropertyList.h"

namespace orvanta::ctl {
using platform::Data;
using platform::Date;

namespace {

constexpr std::string_view kDate = "$date";
constexpr std::string_view kData = "$data";

// The value that a tagged object stands for; nullopt for an object without a tag.
Result<std::optional<Value>> taggedValue(const Dictionary& object) {
  const Value* date = object.find(kDate);
  const Value* data = object.find(kData);
  if (date == nullptr && data == nullptr) return std::optional<Value>();
  if (object.size() != 1) return Failure{"\"$date\" and \"$data\" must be alone in their object"};
  if (date != nullptr) {
    if (!date->isNumber() || date->isBool()) return Failure{"\"$date\" must be a number of seconds since 1970"};
    return std::optional<Value>(Date{date->doubleValue()});
  }
  auto bytes = data->string() == nullptr ? std::nullopt : platform::decodeBase64(*data->string());
  if (!bytes) return Failure{"\"$data\" must be a base64 text"};
  return std::optional<Value>(Data{std::move(*bytes)});
}

// Puts values in place of tagged objects. Returns what is wrong, if anything. The parser bounds the depth.
std::optional<std::string> resolveTags(Value& value) {
  if (auto* array = value.array()) {
    for (auto& element : *array) {
      if (auto problem = resolveTags(element)) return problem;
    }
  } else if (auto* object = value.dictionary()) {
    auto tagged = taggedValue(*object);
    if (!tagged) return tagged.error();
    if (*tagged) {
      value = std::move(**tagged);
      return std::nullopt;
    }
    for (auto& entry : *object) {
      if (auto problem = resolveTags(entry.second)) return problem;
    }
  }
  return std::nullopt;
}

Value withTags(const Value& value) {
  if (const auto* date = value.date()) return Dictionary{{std::string(kDate), date->secondsSince1970}};
  if (const auto* data = value.data()) return Dictionary{{std::string(kData), platform::encodeBase64(data->bytes)}};
  if (const auto* array = value.array()) {
    Array copy;
    copy.reserve(array->size());
    for (const auto& element : *array) copy.push_back(withTags(element));
    return copy;
  }
  if (const auto* dictionary = value.dictionary()) {
    Dictionary copy;
    for (const auto& [key, element] : *dictionary) copy.set(key, withTags(element));
    return copy;
  }
  return value;
}

}  // namespace

Result<Value> parseTaggedJson(std::string_view text) {
  auto parsed = platform::parseJson(text);
  if (!parsed) return parsed;
  if (auto problem = resolveTags(*parsed)) return Failure{std::move(*problem)};
  return parsed;
}

std::string writeTaggedJson(const Value& value, bool pretty) {
  return platform::writeJson(withTags(value), pretty);
}

namespace {

template <class Number>
bool parseWhole(std::string_view text, Number& out) {
  const auto result = std::from_chars(text.data(), text.data() + text.size(), out);
  return result.ec == std::errc() && result.ptr == text.data() + text.size();
}

// The value that a text on the command line stands for, before it is known whether it can be stored.
Result<Value> typedValue(const std::string& text, const std::string& type) {
  if (type == "string") return Value(text);
  if (type == "int") {
    std::int64_t number = 0;
    if (!parseWhole(text, number)) return Failure{"'" + text + "' is not a whole number"};
    return Value(number);
  }
  if (type == "float") {
    double number = 0;
    if (!parseWhole(text, number) || !std::isfinite(number)) return Failure{"'" + text + "' is not a number"};
    return Value(number);
  }
  if (type == "bool") {
    if (text == "true" || text == "yes" || text == "1") return Value(true);
    if (text == "false" || text == "no" || text == "0") return Value(false);
    return Failure{"'" + text + "' is neither true nor false"};
  }
  if (type == "json") {
    auto parsed = parseTaggedJson(text);
    if (parsed && parsed->isNull()) return Failure{"null is not a value; use 'defaults delete' to remove a key"};
    return parsed;
  }
  return Failure{"'" + type + "' is not a type; there are string, int, float, bool and json"};
}

}  // namespace

Result<Value> parseDefaultsValue(const std::string& text, const std::string& type) {
  auto value = typedValue(text, type);
  if (!value) return value;
  // Tried in the form in which it will be stored: that has no null, for example.
  const auto written = platform::writeXmlPropertyList(*value);
  if (!written) return Failure{"the value cannot be stored: " + written.error()};
  return value;
}

std::string showDefaultsValue(const Value& value) {
  if (const auto* text = value.string()) return *text;
  return writeTaggedJson(value);
}

}  // namespace orvanta::ctl
