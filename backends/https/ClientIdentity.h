#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace orvanta {

// Chooses the identifier under which a backend posts. Used on the session's queue.
class ClientIdentity {
 public:
  // How the user's consent and the storebag stand to each other.
  enum DnuType : std::int32_t {
    kConsentRespected = 0,
    kConsentOverriddenNotGiven = 1,
    kConsentOverriddenGiven = 2,
  };

  ClientIdentity(std::string respectDnu, std::string overrideDnu)
      : _uuidRespectDnu(std::move(respectDnu)), _uuidOverrideDnu(std::move(overrideDnu)) {}

  DnuType dnuType() const { return _dnuType; }
  void setDnuType(DnuType type) { _dnuType = type; }
  void setUuidCustom(std::string uuid) { _uuidCustom = std::move(uuid); }
  void setExtrasOnInternal(std::int32_t extras) { _extrasOnInternal = extras; }

  // The identifier of the next message. An internal device's own identifier stands in only where there is one.
  const std::string& choose(bool isInternal, const std::string& deviceID) const {
    if (_extrasOnInternal != 0 && isInternal && !deviceID.empty()) return deviceID;
    if (!_uuidCustom.empty()) return _uuidCustom;
    return _dnuType != kConsentRespected ? _uuidOverrideDnu : _uuidRespectDnu;
  }

 private:
  const std::string _uuidRespectDnu;
  const std::string _uuidOverrideDnu;
  std::string _uuidCustom;  // empty until a section asks for it
  DnuType _dnuType = kConsentRespected;
  std::int32_t _extrasOnInternal = 0;
};

}  // namespace orvanta
