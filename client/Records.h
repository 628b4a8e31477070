#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "interface/Values.h"

namespace orvanta {

// The records that a client sends to the daemon, as plain structs; dictionary() gives them the keys of
// OrvantaConstants.h.

// Links the session to related ones of other clients.
struct HierarchyToken {
  std::string tokenID = {};
  std::uint32_t level = 0;  // 0 is the root
};

struct SessionInfo {
  std::uint32_t sessionID = 0;
  std::int32_t clientType = 0;
  std::int32_t clientVersion = 0;  // the low 16 bits count
  bool requireUserInfo = false;
  bool batchEvent = false;
  std::optional<HierarchyToken> hierarchyToken = std::nullopt;

  SharedDictionary dictionary() const;
};

struct UserInfo {
  std::optional<std::string> clientName = std::nullopt;
  std::optional<std::string> serviceName = std::nullopt;
  Dictionary others = {};  // merged into the events; the two names above win over equal keys

  SharedDictionary dictionary() const;
};

struct MessageParameters {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload = std::nullopt;
  // The two bits of a flag by name; joined with `flag`.
  bool realtime = false;  // goes out at once, to the realtime URL
  bool promote = false;   // a session that holds its events back reports from now on
  std::uint32_t flag = 0;

  SharedDictionary dictionary() const;
};

inline constexpr std::uint32_t kMessageFlagRealtime = 1;
inline constexpr std::uint32_t kMessageFlagPromote = 2;

}  // namespace orvanta
