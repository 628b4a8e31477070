#pragma once

#include <compare>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "interface/Values.h"
#include "platform/core/Clock.h"

namespace orvanta {

// The three version bytes of "major.middle.minor": leading integers, cut to 8 bits, 0 when missing.
struct SelfVersion {
  std::uint8_t major = 0;
  std::uint8_t middle = 0;
  std::uint8_t minor = 0;
  auto operator<=>(const SelfVersion&) const = default;  // NOLINT(modernize-use-nullptr): sees a 0 in what is generated

  static SelfVersion parse(std::string_view text);
  // "major.middle", and ".minor" unless that is 0.
  std::string text() const;
};

// Facts of the session and the device that every backend of a session shares.
struct BackendIdentity {
  std::uint32_t sessionID = 0;
  std::int32_t clientType = 0;
  std::uint16_t clientVersion = 0;
  std::string deviceID;       // at most 40 bytes; empty when the device reports none
  std::string productFamily;  // the device's; may be empty
  std::optional<std::string> productVersion;
  std::optional<std::string> buildVersion;
  std::optional<std::string> productType;
  bool isInternal = false;  // the device runs an internal build
  bool requireUserInfo = false;
  SelfVersion selfVersion;             // of the client framework
  platform::TimeValue startTimestamp;  // of the session
};

// Everything that a session makes its backends with, besides each one's name and profile.
struct BackendSetup {
  BackendIdentity identity;
  bool batchEvents = false;   // until an evaluation says otherwise
  SharedDictionary userInfo;  // until the session learns of other; may be null
};

}  // namespace orvanta
