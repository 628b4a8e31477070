#include "session/SessionInfoRecord.h"

#include <fmt/format.h>

#include "interface/OrvantaConstants.h"
#include "interface/WireLimits.h"

namespace orvanta {

namespace {

std::int64_t integer(const Dictionary& record, std::string_view key) {
  const Value* value = record.find(key);
  return value == nullptr ? 0 : value->integerValue();
}

bool boolean(const Dictionary& record, std::string_view key) {
  const Value* value = record.find(key);
  return value != nullptr && value->boolValue();
}

}  // namespace

std::optional<std::string> HierarchyPosition::refusal() const {
  if (!token || (level >= 0 && level <= kMaximumHierarchyLevel)) return std::nullopt;
  return fmt::format("hierarchy level {} is not between 0 and {}", level, kMaximumHierarchyLevel);
}

SessionInfoRecord SessionInfoRecord::read(const Dictionary& record) {
  SessionInfoRecord info;
  info.sessionID = static_cast<std::uint32_t>(integer(record, kOrvantaSessionInfoSessionID));
  info.clientType = static_cast<std::int32_t>(integer(record, kOrvantaSessionInfoClientType));
  info.clientVersion = static_cast<std::uint16_t>(integer(record, kOrvantaSessionInfoClientVersion));
  info.requireUserInfo = boolean(record, kOrvantaSessionInfoRequireUserInfo);
  info.batchEvent = boolean(record, kOrvantaSessionInfoBatchEvent);
  if (const Dictionary* hierarchy = record.dictionary(kOrvantaSessionInfoHierarchyToken)) {
    if (const std::string* token = hierarchy->text(kOrvantaHierarchyTokenTokenID)) info.hierarchy.token = *token;
    info.hierarchy.level = integer(*hierarchy, kOrvantaHierarchyTokenLevel);
  }
  return info;
}

}  // namespace orvanta
