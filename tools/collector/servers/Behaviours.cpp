#include "tools/collector/servers/Behaviours.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>

#include "tools/collector/servers/SettingsReader.h"

namespace orvanta::collector {

namespace {

constexpr std::array<std::pair<ConnectionFault, std::string_view>, 6> kFaultTexts{
    {{ConnectionFault::none, "none"},
     {ConnectionFault::reset, "reset"},
     {ConnectionFault::silent, "silent"},
     {ConnectionFault::truncate, "truncate"},
     {ConnectionFault::corrupt, "corrupt"},
     {ConnectionFault::garbage, "garbage"}}};

constexpr std::int64_t kLongestDelayMs = 600'000;

std::optional<ConnectionFault> faultFromText(std::string_view text) {
  for (const auto& [fault, name] : kFaultTexts) {
    if (name == text) return fault;
  }
  return std::nullopt;
}

}  // namespace

std::string_view connectionFaultText(ConnectionFault fault) {
  return std::find_if(kFaultTexts.begin(), kFaultTexts.end(), [&](const auto& row) { return row.first == fault; })
      ->second;
}

void Behaviours::set(const std::string& path, PathBehaviour behaviour) {
  const std::lock_guard lock(_mutex);
  _byPath.insert_or_assign(path, std::move(behaviour));
}

bool Behaviours::clear(const std::string& path) {
  const std::lock_guard lock(_mutex);
  return _byPath.erase(path) > 0;
}

void Behaviours::clearAll() {
  const std::lock_guard lock(_mutex);
  _byPath.clear();
}

std::optional<PathBehaviour> Behaviours::take(std::string_view path) {
  const std::lock_guard lock(_mutex);
  auto found = _byPath.find(path);
  if (found == _byPath.end()) {
    for (auto it = _byPath.begin(); it != _byPath.end(); ++it) {
      std::string_view pattern = it->first;
      if (!pattern.ends_with('*')) continue;
      pattern.remove_suffix(1);
      const bool longer = found == _byPath.end() || it->first.size() > found->first.size();
      if (path.starts_with(pattern) && longer) found = it;
    }
  }
  if (found == _byPath.end()) return std::nullopt;
  PathBehaviour behaviour = found->second;
  if (found->second.times && --*found->second.times == 0) _byPath.erase(found);
  return behaviour;
}

Value Behaviours::describe() const {
  const std::lock_guard lock(_mutex);
  Dictionary all;
  for (const auto& [path, behaviour] : _byPath) {
    Dictionary one{{"fault", std::string(connectionFaultText(behaviour.fault))},
                   {"delayMs", static_cast<std::int64_t>(behaviour.delay.count())}};
    if (behaviour.status) one.set("status", *behaviour.status);
    if (behaviour.body) one.set("body", *behaviour.body);
    if (behaviour.times) one.set("times", static_cast<std::int64_t>(*behaviour.times));
    if (!behaviour.headers.empty()) {
      Dictionary headers;
      for (const auto& [name, text] : behaviour.headers) headers.set(name, text);
      one.set("headers", std::move(headers));
    }
    all.set(path, std::move(one));
  }
  return all;
}

Result<PathSetting> parsePathSetting(const Value& value) {
  SettingsReader reader(value);
  PathSetting setting;
  PathBehaviour& behaviour = setting.behaviour;
  setting.path = reader.text("path").value_or("");
  if (const auto status = reader.integer("status", 100, 599)) behaviour.status = static_cast<int>(*status);
  behaviour.body = reader.text("body");
  behaviour.delay = std::chrono::milliseconds(reader.integer("delayMs", 0, kLongestDelayMs).value_or(0));
  if (const auto times = reader.integer("times", 1, 1'000'000)) behaviour.times = static_cast<std::size_t>(*times);
  if (const auto text = reader.text("fault")) {
    const auto fault = faultFromText(*text);
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
  if (auto failure = reader.finish()) return std::move(*failure);
  if (setting.path.empty() || (setting.path.front() != '/' && setting.path != "*")) {
    return Failure{"\"path\" must be a path such as /events, or end in *"};
  }
  return setting;
}

}  // namespace orvanta::collector
