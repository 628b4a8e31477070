#include "tools/collector/api/ControlSettings.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdint>
#include <optional>
#include <set>
#include <string_view>
#include <utility>

namespace orvanta::collector {

namespace {

constexpr std::int64_t kMostCopies = 1000;
constexpr std::int64_t kMostTimes = 1'000'000;
constexpr std::int64_t kLongestDelayMs = 600'000;
constexpr std::int64_t kHighestMaxAge = 1'000'000'000;
constexpr const char* kMaxAgeOfBag = "refresh_cycle";

// Reads the keys of one settings object and remembers the first thing that was wrong: not an object, a wrong type, a
// number out of range, or, found by finish(), a key that was never read.
class SettingsReader {
 public:
  explicit SettingsReader(const Value& value) : _settings(value.dictionary()) {
    if (_settings == nullptr) complain("the settings must be a JSON object");
  }

  // Null if absent.
  const Value* take(const char* key) {
    _taken.insert(key);
    return _settings != nullptr ? _settings->find(key) : nullptr;
  }
  // Return nullopt if the key is absent or wrong.
  std::optional<std::string> text(const char* key) {
    const Value* value = take(key);
    if (value == nullptr) return std::nullopt;
    if (value->string() != nullptr) return *value->string();
    complain(fmt::format("\"{}\" must be text", key));
    return std::nullopt;
  }
  std::optional<std::int64_t> integer(const char* key, std::int64_t least, std::int64_t most) {
    const Value* value = take(key);
    if (value == nullptr) return std::nullopt;
    const auto* number = std::get_if<std::int64_t>(&value->storage());
    if (number != nullptr && *number >= least && *number <= most) return *number;
    complain(fmt::format("\"{}\" must be a whole number from {} to {}", key, least, most));
    return std::nullopt;
  }
  std::optional<bool> boolean(const char* key) {
    const Value* value = take(key);
    if (value == nullptr) return std::nullopt;
    if (const bool* flag = std::get_if<bool>(&value->storage())) return *flag;
    complain(fmt::format("\"{}\" must be true or false", key));
    return std::nullopt;
  }
  PropertyListForm form(const char* key, PropertyListForm otherwise) {
    const auto name = text(key);
    if (!name) return otherwise;
    const auto form = propertyListFormFromText(*name);
    if (!form) complain(fmt::format("\"{}\" must be \"xml\" or \"binary\"", key));
    return form.value_or(otherwise);
  }

  // The first thing that was wrong, if any.
  Result<void> finish() const {
    if (!_failure.ok() || _settings == nullptr) return _failure;
    for (const auto& [key, value] : *_settings) {
      if (!_taken.contains(key)) return Failure{fmt::format("no such setting: \"{}\"", key)};
    }
    return {};
  }

 private:
  void complain(std::string text) {
    if (_failure.ok()) _failure = Failure{std::move(text)};
  }

  const Dictionary* _settings;
  std::set<std::string, std::less<>> _taken;
  Result<void> _failure;
};

}  // namespace

Result<PathSetting> parsePathSetting(const Value& value) {
  SettingsReader reader(value);
  PathSetting setting;
  PathBehaviour& behaviour = setting.behaviour;
  setting.path = reader.text("path").value_or("");
  if (const auto status = reader.integer("status", 100, 599)) behaviour.status = static_cast<int>(*status);
  behaviour.body = reader.text("body");
  behaviour.delay = std::chrono::milliseconds(reader.integer("delayMs", 0, kLongestDelayMs).value_or(0));
  if (const auto times = reader.integer("times", 1, kMostTimes)) behaviour.times = static_cast<std::size_t>(*times);
  if (const auto text = reader.text("fault")) {
    const auto fault = connectionFaultFromText(*text);
    if (!fault) return Failure{fmt::format("no such fault: \"{}\"", *text)};
    behaviour.fault = *fault;
  }
  if (const Value* headers = reader.take("headers")) {
    if (headers->dictionary() == nullptr) return Failure{"\"headers\" must be an object"};
    for (const auto& [name, text] : *headers->dictionary()) {
      const auto breaks = [](const std::string& part) { return part.find_first_of("\r\n") != std::string::npos; };
      if (text.string() == nullptr || name.empty() || breaks(name) || breaks(*text.string())) {
        return Failure{fmt::format("header \"{}\" must be one line of text", name)};
      }
      behaviour.headers.emplace_back(name, *text.string());
    }
  }
  if (const auto read = reader.finish(); !read) return Failure{read.error()};
  if (setting.path.empty() || (setting.path.front() != '/' && setting.path != "*")) {
    return Failure{"\"path\" must be a path such as /events, or end in *"};
  }
  return setting;
}

Dictionary describe(const PathBehaviour& behaviour) {
  Dictionary described{{"fault", std::string(connectionFaultText(behaviour.fault))},
                       {"delayMs", static_cast<std::int64_t>(behaviour.delay.count())}};
  if (behaviour.status) described.set("status", *behaviour.status);
  if (behaviour.body) described.set("body", *behaviour.body);
  if (behaviour.times) described.set("times", static_cast<std::int64_t>(*behaviour.times));
  if (!behaviour.headers.empty()) {
    Dictionary headers;
    for (const auto& [name, text] : behaviour.headers) headers.set(name, text);
    described.set("headers", std::move(headers));
  }
  return described;
}

Result<AcknowledgementSettings> parseAcknowledgementSettings(const Value& value) {
  SettingsReader reader(value);
  AcknowledgementSettings settings;
  const auto copies = [&reader](const char* key) {
    return static_cast<unsigned>(reader.integer(key, 0, kMostCopies).value_or(0));
  };
  settings.acknowledge = reader.boolean("acknowledge").value_or(true);
  settings.lossPercent = static_cast<unsigned>(reader.integer("lossPercent", 0, 100).value_or(0));
  settings.delay = std::chrono::milliseconds(reader.integer("delayMs", 0, kLongestDelayMs).value_or(0));
  settings.duplicates = copies("duplicates");
  settings.unknownNumbers = copies("unknownNumbers");
  settings.tooShort = copies("tooShort");
  settings.foreign = copies("foreign");
  if (const auto read = reader.finish(); !read) return Failure{read.error()};
  return settings;
}

Dictionary describe(const AcknowledgementSettings& settings) {
  return Dictionary{{"acknowledge", settings.acknowledge},
                    {"lossPercent", settings.lossPercent},
                    {"delayMs", static_cast<std::int64_t>(settings.delay.count())},
                    {"duplicates", settings.duplicates},
                    {"unknownNumbers", settings.unknownNumbers},
                    {"tooShort", settings.tooShort},
                    {"foreign", settings.foreign}};
}

Result<StorebagSettings> parseStorebagSettings(const Value& value) {
  SettingsReader reader(value);
  StorebagSettings settings;
  settings.container = reader.form("container", settings.container);
  settings.bag = reader.form("bag", settings.bag);
  settings.lastModified = reader.boolean("lastModified").value_or(settings.lastModified);
  const Value* maxAge = reader.take("maxAge");
  settings.maxAgeOfBag = maxAge == nullptr || *maxAge == kMaxAgeOfBag;
  if (maxAge != nullptr && maxAge->isNull()) {
    settings.maxAge = std::nullopt;
  } else if (!settings.maxAgeOfBag) {
    settings.maxAge = reader.integer("maxAge", -kHighestMaxAge, kHighestMaxAge);
  }
  if (const auto read = reader.finish(); !read) return Failure{read.error()};
  return settings;
}

Dictionary describe(const StorebagSettings& settings) {
  return Dictionary{{"container", std::string(propertyListFormText(settings.container))},
                    {"bag", std::string(propertyListFormText(settings.bag))},
                    {"lastModified", settings.lastModified},
                    {"maxAge", settings.maxAgeOfBag ? Value(kMaxAgeOfBag)
                               : settings.maxAge    ? Value(*settings.maxAge)
                                                    : Value()}};
}

}  // namespace orvanta::collector
