#include "tools/orvantactl/JsonValues.h"

#include <optional>
#include <utility>

#include "platform/codec/Json.h"
#include "platform/codec/PropertyList.h"

namespace orvanta::ctl {
using platform::Data;
using platform::Date;

namespace {

constexpr std::string_view kDate = "$date";
constexpr std::string_view kData = "$data";

// The value that a tagged object stands for; null for an object without a tag.
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

// The parser bounds the depth.
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

}  // namespace orvanta::ctl
