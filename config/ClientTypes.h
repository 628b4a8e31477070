#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace orvanta {

// The client types 0-18: each names the program family that a session belongs to.

// Those whose storebag is "confluo", by their sender codes.
inline constexpr std::int32_t kClientTypeXF = 7;
inline constexpr std::int32_t kClientTypeZJ = 11;
inline constexpr std::int32_t kClientTypeZEPHQ = 13;

// The code under which reports name the client type; empty for types outside 0-18.
std::string_view senderCodeForClientType(std::int32_t clientType);
// The storebag that configures the client type; several share one. None for types 0-4 and outside 0-18.
std::optional<std::string_view> storebagNameForClientType(std::int32_t clientType);

}  // namespace orvanta
