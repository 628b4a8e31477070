#include "tools/collector/servers/Behaviours.h"

#include <algorithm>
#include <array>
#include <utility>

namespace orvanta::collector {

namespace {

constexpr std::array<std::pair<ConnectionFault, std::string_view>, 6> kFaultTexts{
    {{ConnectionFault::none, "none"},
     {ConnectionFault::reset, "reset"},
     {ConnectionFault::silent, "silent"},
     {ConnectionFault::truncate, "truncate"},
     {ConnectionFault::corrupt, "corrupt"},
     {ConnectionFault::garbage, "garbage"}}};

}  // namespace

std::string_view connectionFaultText(ConnectionFault fault) {
  return std::find_if(kFaultTexts.begin(), kFaultTexts.end(), [&](const auto& row) { return row.first == fault; })
      ->second;
}

std::optional<ConnectionFault> connectionFaultFromText(std::string_view text) {
  for (const auto& [fault, name] : kFaultTexts) {
    if (name == text) return fault;
  }
  return std::nullopt;
}

void Behaviours::set(const std::string& path, PathBehaviour behaviour) {
  const platform::MutexLock lock(_mutex);
  _byPath.insert_or_assign(path, std::move(behaviour));
}

bool Behaviours::clear(const std::string& path) {
  const platform::MutexLock lock(_mutex);
  return _byPath.erase(path) > 0;
}

void Behaviours::clearAll() {
  const platform::MutexLock lock(_mutex);
  _byPath.clear();
}

std::optional<PathBehaviour> Behaviours::take(std::string_view path) {
  const platform::MutexLock lock(_mutex);
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

Behaviours::ByPath Behaviours::all() const {
  const platform::MutexLock lock(_mutex);
  return _byPath;
}

}  // namespace orvanta::collector
