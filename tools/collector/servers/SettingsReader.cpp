#include "tools/collector/servers/SettingsReader.h"

#include <fmt/format.h>

#include <utility>

namespace orvanta::collector {

SettingsReader::SettingsReader(const Value& value) : _settings(value.dictionary()) {
  if (_settings == nullptr) complain("the settings must be a JSON object");
}

const Value* SettingsReader::take(const char* key) {
  _taken.insert(key);
  return _settings != nullptr ? _settings->find(key) : nullptr;
}

std::optional<std::string> SettingsReader::text(const char* key) {
  const Value* value = take(key);
  if (value == nullptr) return std::nullopt;
  if (value->string() != nullptr) return *value->string();
  complain(fmt::format("\"{}\" must be text", key));
  return std::nullopt;
}

std::optional<std::int64_t> SettingsReader::integer(const char* key, std::int64_t least, std::int64_t most) {
  const Value* value = take(key);
  if (value == nullptr) return std::nullopt;
  const auto* number = std::get_if<std::int64_t>(&value->storage());
  if (number != nullptr && *number >= least && *number <= most) return *number;
  complain(fmt::format("\"{}\" must be a whole number from {} to {}", key, least, most));
  return std::nullopt;
}

std::optional<bool> SettingsReader::boolean(const char* key) {
  const Value* value = take(key);
  if (value == nullptr) return std::nullopt;
  if (const bool* flag = std::get_if<bool>(&value->storage())) return *flag;
  complain(fmt::format("\"{}\" must be true or false", key));
  return std::nullopt;
}

std::optional<Failure> SettingsReader::finish() const {
  if (_failure || _settings == nullptr) return _failure;
  for (const auto& [key, value] : *_settings) {
    if (!_taken.contains(key)) return Failure{fmt::format("no such setting: \"{}\"", key)};
  }
  return std::nullopt;
}

void SettingsReader::complain(std::string text) {
  if (!_failure) _failure = Failure{std::move(text)};
}

}  // namespace orvanta::collector
