#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace orvanta {

// The keys that every event carries about its session, device and time. A payload's key of the same name gives way to
// them.
enum class ReservedKey : std::uint8_t {
  // The same in every event of a session.
  startTS,
  sender,
  clientVersion,
  productFamily,
  productModel,
  osVersion,
  build,
  internal,
  reportVers,
  // Each event's own.
  sessionID,
  eventNumber,
  method,
  status,
  clientTS,
  eventTime,
  timezoneOffset,
};

inline constexpr std::size_t kReservedKeyCount = 16;
inline constexpr std::array<std::string_view, kReservedKeyCount> kReservedKeyNames{
    "_startTS", "_sender",   "_clientVersion", "_productFamily", "_productModel", "_osVersion",
    "_build",   "_internal", "_reportVers",    "_sessionID",     "_eventNumber",  "_method",
    "_status",  "_clientTS", "eventTime",      "_timezoneOffset"};

constexpr std::string_view nameOf(ReservedKey key) {
  return kReservedKeyNames[static_cast<std::size_t>(key)];
}

// Sets of reserved keys.
using ReservedKeys = std::uint32_t;
constexpr ReservedKeys setOf(ReservedKey key) {
  return 1U << static_cast<unsigned>(key);
}

// The set that holds just the reserved key of that exact name; the empty set for other names.
constexpr ReservedKeys reservedKeyNamed(std::string_view name) {
  // Nearly all names of payloads end here.
  if (name.size() < 6 || (name.front() != '_' && name != nameOf(ReservedKey::eventTime))) return 0;
  for (std::size_t i = 0; i < kReservedKeyCount; ++i) {
    if (kReservedKeyNames[i] == name) return 1U << i;
  }
  return 0;
}

}  // namespace orvanta
