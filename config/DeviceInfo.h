#pragma once

#include <array>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "config/Platform.h"

namespace orvanta {

// 40 characters and a terminator.
using DeviceIDBuffer = std::array<char, 41>;

// Fills the buffer with the unique device identifier, cut to 40 bytes; left as it was without an answer.
void copyUniqueDeviceID(Platform& platform, DeviceIDBuffer& buffer);
std::string_view deviceIDText(const DeviceIDBuffer& buffer);

// An identifier that stays the same across restarts, per pair of suffix parts (absent counts as empty): made on first
// request, kept in the user defaults under "uuid:FIRST:SECOND". Never fails; one that cannot be stored is logged.
std::string getPersistentIdentifierForCustomClientIDSuffix(Platform& platform, const std::optional<std::string>& first,
                                                           const std::optional<std::string>& second);

}  // namespace orvanta
