#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "interface/Values.h"

namespace orvanta {

// A session's place among related sessions.
struct HierarchyPosition {
  std::optional<std::string> token;  // nullopt: standalone
  std::int64_t level = 0;            // 0 is the root

  // Returns what is wrong with the level; nullopt for one that can be used, and for standalone sessions.
  std::optional<std::string> refusal() const;
};

// The session-info record as the daemon reads it: missing entries read as 0 or false.
struct SessionInfoRecord {
  std::uint32_t sessionID = 0;
  std::int32_t clientType = 0;
  std::uint16_t clientVersion = 0;
  bool requireUserInfo = false;
  bool batchEvent = false;
  HierarchyPosition hierarchy;  // standalone where the record has no dictionary for it

  static SessionInfoRecord read(const Dictionary& record);
};

}  // namespace orvanta
