#pragma once

#include <cstdint>
#include <span>
#include <string_view>

namespace orvanta {

// Every key that the daemon reads in a storebag, each one named by its place and its own name. One row a key in the
// table behind storebagKeys(), in this order.
enum class StorebagKey : std::uint8_t {
  documentSignature,
  documentBag,
  bagVersion,
  bagRefreshCycle,
  bagDevelopment,
  bagInternal,
  bagSeed,
  bagRelease,
  dashboard,
  uploadServer,
  httpPost,
  httpPost2,
  voltmark,
  brisk,
  httpsClients,
  httpsDisplayURL,
  client,
  service,
  enabledSince,
  overrideDNU,
  localeWhitelist,
  deviceWhitelist,
  deviceBlacklist,
  filters,
  samplingThreshold,
  perCountrySamplingThresholds,
  overrideSampling,
  eventWhitelist,
  eventBlacklist,
  expedite,
  postURL,
  realtimePostURL,
  eventThreshold,
  extrasOnInternal,
  customClientID,
  thresholdCountry,
  threshold,
  filterKey,
  filterMethod,
  filterStatus,
  filterAction,
  dashboardIP,
  dashboardPort,
  dashboardReliable,
  dashboardPostURL,
  dashboardDisplayURL,
  uploadPostURL,
  uploadDisplayURL,
};

// The dictionary that holds the key.
enum class StorebagPlace : std::uint8_t {
  document,          // as it is served
  bag,               // signed, inside the document
  environment,       // a section of the bag
  httpsProfile,      // of http_post and http_post2
  clientSection,     // an element of the HTTPS profile's list
  countryThreshold,  // an element of a client section's list
  filterRule,        // the same
  dashboardProfile,
  uploadProfile,
};

enum class StorebagType : std::uint8_t {
  any,
  text,
  base64,        // a text
  number,        // not a text that reads as one
  textOrNumber,  // a number, or a text that is read by its leading number
  version,       // "8.0.1", or a number
  texts,         // a list of texts and numbers
  categories,    // the same, read as numbers
  section,       // a dictionary: backend names to profiles
  profile,       // a dictionary
  clientSections,
  filterRules,
  countryThresholds,
};

// How a value of another type counts.
enum class WrongType : std::uint8_t {
  never,            // any type serves
  absent,           // as no value
  zero,             // as 0
  fitsNoClient,     // the section is for no client
  reportsNothing,   // the section is chosen and disables the backend
  standsForPeriod,  // as a value, but 500 is used, with a warning
};

struct StorebagKeyInfo {
  StorebagKey key;
  StorebagPlace place;
  std::string_view name;
  StorebagType type;
  std::string_view absent;  // what holds without the key
  WrongType wrongType;
  std::string_view meaning;
};

// The whole table, constant. A storebag's documentation is checked against it.
std::span<const StorebagKeyInfo> storebagKeys();
const StorebagKeyInfo& infoOf(StorebagKey key);
std::string_view nameOf(StorebagKey key);
// As the documentation says it.
std::string_view describe(StorebagType type);
std::string_view describe(WrongType wrongType);

}  // namespace orvanta
