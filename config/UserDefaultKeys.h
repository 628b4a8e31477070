#pragma once

#include <string_view>

namespace orvanta {

// The user defaults that the daemon reads; docs/operation.md says what each does.
inline constexpr std::string_view kStorebagURLKey = "orvanta_storebag_url";
inline constexpr std::string_view kEnvironmentTypeKey = "environmentType";
inline constexpr std::string_view kPostURLKey = "httpsPostURL";
inline constexpr std::string_view kRealtimePostURLKey = "httpsRealtimePostURL";
inline constexpr std::string_view kForceEventLoggingKey = "forceEventLogging";
inline constexpr std::string_view kRespectConsentKey = "uuid-respect-dnu";
inline constexpr std::string_view kOverrideConsentKey = "uuid-override-dnu";
// Before ":", a client's name, ":" and its service's name.
inline constexpr std::string_view kIdentifierPrefix = "uuid";

}  // namespace orvanta
