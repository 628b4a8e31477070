#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "interface/OrvantaConstants.h"
#include "interface/Values.h"

namespace orvanta {

// The session-info record as the daemon reads it: what is missing reads as 0 or false.
struct SessionInfoRecord {
  std::uint32_t sessionID = 0;
  std::int32_t clientType = 0;
  std::uint16_t clientVersion = 0;
  bool requireUserInfo = false;
  bool batchEvent = false;

  static SessionInfoRecord read(const Dictionary& record) {
    const auto integer = [&record](std::string_view key) {
      const auto* value = record.find(key);
      return value == nullptr ? 0 : value->integerValue();
    };
    const auto boolean = [&record](std::string_view key) {
      const auto* value = record.find(key);
      return value != nullptr && value->boolValue();
    };
    SessionInfoRecord info;
    info.sessionID = static_cast<std::uint32_t>(integer(kOrvantaSessionInfoSessionID));
    info.clientType = static_cast<std::int32_t>(integer(kOrvantaSessionInfoClientType));
    info.clientVersion = static_cast<std::uint16_t>(integer(kOrvantaSessionInfoClientVersion));
    info.requireUserInfo = boolean(kOrvantaSessionInfoRequireUserInfo);
    info.batchEvent = boolean(kOrvantaSessionInfoBatchEvent);
    return info;
  }
};

// A session's place among related sessions, from the session info's hierarchy-token record.
struct HierarchyPosition {
  std::optional<std::string> token;  // none: standalone
  std::int64_t level = 0;            // 0 is the root

  // Without a record, or when that value is no dictionary: standalone.
  static HierarchyPosition read(const Dictionary& sessionInfo) {
    HierarchyPosition position;
    const auto* value = sessionInfo.find(kOrvantaSessionInfoHierarchyToken);
    const auto* record = value == nullptr ? nullptr : value->dictionary();
    if (record == nullptr) return position;
    if (const auto* token = record->find(kOrvantaHierarchyTokenTokenID);
        token != nullptr && token->string() != nullptr) {
      position.token = *token->string();
    }
    if (const auto* level = record->find(kOrvantaHierarchyTokenLevel)) position.level = level->integerValue();
    return position;
  }
};

// None when the hierarchy level can be used; else what is wrong with it.
std::optional<std::string> refusalOfHierarchy(const Dictionary& sessionInfo);

}  // namespace orvanta
