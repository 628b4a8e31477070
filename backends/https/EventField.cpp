#include "backends/https/EventField.h"

#include <cmath>

#include "config/Conversions.h"
#include "interface/OrvantaLogging.h"
#include "platform/codec/Json.h"

namespace orvanta {
namespace {

constexpr std::string_view kPrettyIndent = "\n      ";
constexpr std::string_view kPrettyEnd = "\n    }";

}  // namespace

bool appendFieldValue(std::string& out, const Value& value) {
  const auto& storage = value.storage();
  if (const auto* text = std::get_if<std::string>(&storage)) {
    platform::appendJsonString(out, *text);
  } else if (const auto* integer = std::get_if<std::int64_t>(&storage)) {
    platform::appendJsonNumber(out, *integer);
  } else if (const auto* real = std::get_if<double>(&storage)) {
    return platform::appendJsonNumber(out, *real);
  } else if (const auto* truth = std::get_if<bool>(&storage)) {
    out.append(*truth ? "true" : "false");
  } else if (const auto* large = std::get_if<std::uint64_t>(&storage)) {
    platform::appendJsonNumber(out, *large);
  } else if (const auto* date = std::get_if<platform::Date>(&storage)) {
    platform::appendJsonNumber(out, sanitizeDouble(date->secondsSince1970));
  } else {
    return false;
  }
  return true;
}

std::optional<std::string> textForDigest(const Value& value) {
  if (const auto* text = value.string()) return *text;
  if (const auto* date = value.date()) return Value(sanitizeDouble(date->secondsSince1970)).description();
  if (!value.isNumber()) return std::nullopt;
  if (const auto* real = std::get_if<double>(&value.storage()); real != nullptr && !std::isfinite(*real)) {
    return std::nullopt;
  }
  return value.description();
}

void FieldWriter::key(std::string_view key) {
  if (_form == Form::pretty) _out.append(kPrettyIndent);
  platform::appendJsonString(_out, key);
  _out.append(_form == Form::pretty ? ": " : ":");
}

void FieldWriter::key(ReservedKey key) {
  if (_form == Form::pretty) _out.append(kPrettyIndent);
  _out.push_back('"');
  _out.append(nameOf(key));
  _out.append(_form == Form::pretty ? "\": " : "\":");
}

void FieldWriter::value(std::string_view key, const Value& value) {
  const std::size_t before = _out.size();
  this->key(key);
  if (appendFieldValue(_out, value)) {
    _out.push_back(',');
    return;
  }
  _out.resize(before);
  if (_form == Form::compact) logUnsendable(key, value);
}

void FieldWriter::text(std::string_view key, std::string_view text) {
  this->key(key);
  platform::appendJsonString(_out, text);
  _out.push_back(',');
}

void FieldWriter::text(ReservedKey key, std::string_view text) {
  this->key(key);
  platform::appendJsonString(_out, text);
  _out.push_back(',');
}

void FieldWriter::number(ReservedKey key, std::int64_t number) {
  this->key(key);
  platform::appendJsonNumber(_out, number);
  _out.push_back(',');
}

void FieldWriter::number(std::initializer_list<ReservedKey> keys, double number) {
  std::size_t begin = 0;
  std::size_t length = 0;
  for (const ReservedKey key : keys) {
    this->key(key);
    if (length != 0) {
      _out.append(_out, begin, length);
      continue;
    }
    begin = _out.size();
    platform::appendJsonNumber(_out, number);
    _out.push_back(',');
    length = _out.size() - begin;
  }
}

void FieldWriter::finish() {
  if (_out.back() == '{') {
    _out.push_back('}');
    return;
  }
  _out.pop_back();
  if (_form == Form::pretty) {
    _out.append(kPrettyEnd);
  } else {
    _out.push_back('}');
  }
}

void logUnsendable(std::string_view key, const Value& value) {
  ORVANTA_LOG(warning, "HTTPSPostBackend(createMessageForPostAndLogging): Tressel unable to handle key: {}, value: {}",
              key, value.description());
}

}  // namespace orvanta
