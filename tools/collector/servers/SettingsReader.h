#pragma once

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <string_view>

#include "interface/Values.h"

namespace orvanta::collector {

// Reads the keys of one settings object and remembers what was wrong: no object, a wrong type, a number out of range,
// or, at the end, a key that nobody asked for (mostly a misspelt one).
class SettingsReader {
 public:
  explicit SettingsReader(const Value& value);

  const Value* take(const char* key);
  std::optional<std::string> text(const char* key);
  std::optional<std::int64_t> integer(const char* key, std::int64_t least, std::int64_t most);
  std::optional<bool> boolean(const char* key);
  // The first thing that was wrong; none when all is well.
  std::optional<Failure> finish() const;

 private:
  void complain(std::string text);

  const Dictionary* _settings;
  std::set<std::string, std::less<>> _taken;
  std::optional<Failure> _failure;
};

}  // namespace orvanta::collector
