#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "interface/OrvantaConstants.h"

namespace orvanta {

// An error as clients get it: code -1 for local failures, the HTTP status for server failures.
struct OrvantaError {
  std::string domain{kOrvantaErrorDomain};
  std::int32_t code = -1;
  std::string description;
  friend bool operator==(const OrvantaError&, const OrvantaError&) = default;
};

inline OrvantaError makeOrvantaError(std::string description, std::int32_t code) {
  return {std::string(kOrvantaErrorDomain), code, std::move(description)};
}

}  // namespace orvanta
