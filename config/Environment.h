#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "config/Platform.h"

namespace orvanta {

// Which section of a storebag this process reads.
enum class EnvironmentType : std::uint32_t { none = 0, development = 1, internal = 2, seed = 3, release = 4 };

// The section's name in a storebag; null for `none`.
const char* environmentSectionName(EnvironmentType type);
// Decided once per platform: the user default "environmentType", else by isInternalBuild. Thread-safe.
EnvironmentType currentEnvironmentType(Platform& platform);

}  // namespace orvanta
