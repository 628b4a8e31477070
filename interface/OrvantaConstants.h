#pragma once

#include <string_view>

namespace orvanta {

// The named service, also the sandbox profile's name, and what a peer must hold to use it.
inline constexpr std::string_view kOrvantaServiceName = "com.kovalt.orvantad";
inline constexpr std::string_view kOrvantaEntitlement = "com.kovalt.private.orvantad";
inline constexpr std::string_view kOrvantaUserDefaultsDomain = "com.kovalt.orvanta";
inline constexpr std::string_view kOrvantaErrorDomain = "com.kovalt.orvanta.error";

// Session info.
inline constexpr std::string_view kOrvantaSessionInfoSessionID = "sessionID";              // number, unsigned 32-bit
inline constexpr std::string_view kOrvantaSessionInfoClientType = "clientType";            // number, see ClientTypes.h
inline constexpr std::string_view kOrvantaSessionInfoClientVersion = "clientVersion";      // number, low 16 bits count
inline constexpr std::string_view kOrvantaSessionInfoRequireUserInfo = "requireUserInfo";  // boolean
inline constexpr std::string_view kOrvantaSessionInfoBatchEvent = "batchEvent";            // boolean
inline constexpr std::string_view kOrvantaSessionInfoHierarchyToken = "hierarchyToken";    // dictionary, keys below
inline constexpr std::string_view kOrvantaHierarchyTokenTokenID = "tokenID";               // string
inline constexpr std::string_view kOrvantaHierarchyTokenLevel = "level";                   // number, 0 is the root

// User info; its other entries are merged into the events.
inline constexpr std::string_view kOrvantaUserInfoClientName = "clientName";    // string
inline constexpr std::string_view kOrvantaUserInfoServiceName = "serviceName";  // string

// Message parameters.
inline constexpr std::string_view kOrvantaMessageParametersCategory = "category";  // number, low 16 bits count
inline constexpr std::string_view kOrvantaMessageParametersType = "type";          // number, low 16 bits count
inline constexpr std::string_view kOrvantaMessageParametersPayload = "payload";    // dictionary
inline constexpr std::string_view kOrvantaMessageParametersFlag = "flag";  // number: 1 realtime, 2 promote, 3 both

// Backends.
inline constexpr std::string_view kOrvantaBackendDashboard = "dashboard";
inline constexpr std::string_view kOrvantaBackendUploadServer = "upload_server";
inline constexpr std::string_view kOrvantaBackendHTTPPost = "http_post";
inline constexpr std::string_view kOrvantaBackendHTTPPost2 = "http_post2";
inline constexpr std::string_view kOrvantaBackendVoltmark = "voltmark";
inline constexpr std::string_view kOrvantaBackendBrisk = "brisk";

}  // namespace orvanta
