#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace orvanta {

// The client types 0-18: each names the program family that a session belongs to.

// Those whose storebag is "confluo", by their sender codes. They alone have a diagnostics adaptor and report the number
// of their session: XF always, the others on internal builds.
inline constexpr std::int32_t kClientTypeXF = 7;
inline constexpr std::int32_t kClientTypeZJ = 11;
inline constexpr std::int32_t kClientTypeZEPHQ = 13;

// The code under which reports name the client type; empty for types outside 0-18.
std::string_view senderCodeForClientType(std::int32_t clientType);
// The storebag that configures the client type; several share one. Nullopt for types 0-4 and outside 0-18.
std::optional<std::string_view> storebagNameForClientType(std::int32_t clientType);

// The daemon has a built-in stand-in for this one.
inline constexpr std::string_view kConfluoStorebag = "confluo";

}  // namespace orvanta
