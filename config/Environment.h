#pragma once

#include <cstdint>
#include <string_view>

namespace orvanta {

class ConfigServices;

// Which section of a storebag this process reads.
enum class EnvironmentType : std::uint32_t { none = 0, development = 1, internal = 2, seed = 3, release = 4 };

// The section's name in a storebag; empty for `none`.
std::string_view environmentSectionName(EnvironmentType type);
// The user default "environmentType", or else what fits the build; logs it. ConfigServices asks once and keeps it.
EnvironmentType userDefaultsEnvironment(ConfigServices& services);

}  // namespace orvanta
