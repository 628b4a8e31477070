#include "config/StorebagKeys.h"

#include <algorithm>
#include <cstddef>
#include <iterator>

#include "interface/OrvantaConstants.h"

namespace orvanta {

namespace {

using Key = StorebagKey;
using Place = StorebagPlace;
using Type = StorebagType;

constexpr StorebagKeyInfo kKeys[] = {
    {Key::documentSignature, Place::document, "signature", Type::base64, "refused", WrongType::absent,
     "the signature over the inner bag's bytes"},
    {Key::documentBag, Place::document, "bag", Type::base64, "refused", WrongType::absent,
     "the inner bag: a whole property list, XML or binary"},

    {Key::bagVersion, Place::bag, "version", Type::any, "empty", WrongType::never,
     "reported in the session-end record as \"StorebagVersion\""},
    {Key::bagRefreshCycle, Place::bag, "refresh_cycle", Type::textOrNumber, "max-age", WrongType::zero,
     "seconds for which a bag that has arrived is fresh, in place of its max-age; at most 86,400 count. 0 in both "
     "fetches for every session"},
    {Key::bagDevelopment, Place::bag, "development", Type::section, "no bag", WrongType::absent,
     "the section of environment 1"},
    {Key::bagInternal, Place::bag, "kovalt_internal", Type::section, "no bag", WrongType::absent,
     "the section of environment 2"},
    {Key::bagSeed, Place::bag, "seed", Type::section, "`release`", WrongType::absent, "the section of environment 3"},
    {Key::bagRelease, Place::bag, "release", Type::section, "no bag", WrongType::absent,
     "the section of environment 4"},

    {Key::dashboard, Place::environment, kOrvantaBackendDashboard, Type::profile, "no backend", WrongType::absent,
     "datagrams to a dashboard server"},
    {Key::uploadServer, Place::environment, kOrvantaBackendUploadServer, Type::profile, "no backend", WrongType::absent,
     "files, posted to an upload server"},
    {Key::httpPost, Place::environment, kOrvantaBackendHTTPPost, Type::profile, "no backend", WrongType::absent,
     "events by HTTPS"},
    {Key::httpPost2, Place::environment, kOrvantaBackendHTTPPost2, Type::profile, "no backend", WrongType::absent,
     "the same again, with its own decision"},
    {Key::voltmark, Place::environment, kOrvantaBackendVoltmark, Type::any, "no backend", WrongType::never,
     "the power log; the profile is not read"},
    {Key::brisk, Place::environment, kOrvantaBackendBrisk, Type::any, "no backend", WrongType::never,
     "the diagnostics adaptor, for client types 7, 11 and 13; the profile is not read"},

    {Key::httpsClients, Place::httpsProfile, "clients", Type::clientSections, "no backend", WrongType::absent,
     "what is reported for whom"},
    {Key::httpsDisplayURL, Place::httpsProfile, "display_url", Type::text, "none", WrongType::absent,
     "a URL that clients may show to people"},

    {Key::client, Place::clientSection, "client", Type::text, "fits all", WrongType::fitsNoClient,
     "1: the client name equals one of these comma-separated names, in any case"},
    {Key::service, Place::clientSection, "service", Type::text, "fits all", WrongType::fitsNoClient,
     "1: one of these comma-separated fragments occurs in the service name, in any case"},
    {Key::enabledSince, Place::clientSection, "enabledSince", Type::version, "fits all", WrongType::fitsNoClient,
     "1: the daemon's version is at least this; missing parts are 0"},
    {Key::overrideDNU, Place::clientSection, "override_dnu", Type::number, "0", WrongType::absent,
     "2: the user has consented to diagnostics, or this is 1"},
    {Key::localeWhitelist, Place::clientSection, "locale_whitelist", Type::texts, "no reports",
     WrongType::reportsNothing,
     "3: one of these fragments occurs in the device's country code (\"DE\"). **Required**: an empty list, too, means "
     "no reports. A device that knows no country passes a list that has an entry"},
    {Key::deviceWhitelist, Place::clientSection, "device_whitelist", Type::texts, "all", WrongType::reportsNothing,
     "4: one of these fragments occurs in the product family; empty: all"},
    {Key::deviceBlacklist, Place::clientSection, "device_blacklist", Type::texts, "all", WrongType::reportsNothing,
     "5: none of these fragments occurs in the product model; an unknown model counts as listed, unless the list is "
     "empty"},
    {Key::filters, Place::clientSection, "filters", Type::filterRules, "no reports", WrongType::reportsNothing,
     "6: the key is there. **Required**, may be an empty list"},
    {Key::samplingThreshold, Place::clientSection, "sampling_threshold", Type::textOrNumber, "no reports",
     WrongType::reportsNothing, "7: the session's draw, from 0 up to 1, is at most this"},
    {Key::perCountrySamplingThresholds, Place::clientSection, "per_country_sampling_thresholds",
     Type::countryThresholds, "no entry", WrongType::reportsNothing,
     "the first entry whose list holds the device's country code replaces `sampling_threshold`"},
    {Key::overrideSampling, Place::clientSection, "override_sampling", Type::textOrNumber, "all held",
     WrongType::reportsNothing, "draws above the threshold and up to this are held, those above it disabled"},
    {Key::eventWhitelist, Place::clientSection, "event_whitelist", Type::categories, "as before",
     WrongType::reportsNothing, "the only categories that may be sent; empty: no event"},
    {Key::eventBlacklist, Place::clientSection, "event_blacklist", Type::categories, "as before",
     WrongType::reportsNothing, "categories that must not be sent; empty: all may"},
    {Key::expedite, Place::clientSection, "expedite", Type::textOrNumber, "the client's wish", WrongType::absent,
     "0: events are batched, also in sessions that do not ask for it; else they go at once, also in sessions that "
     "batch. Taken from the first section whose `client` and `service` fit"},
    {Key::postURL, Place::clientSection, "post_url", Type::text, "as before", WrongType::absent,
     "where events and batches go"},
    {Key::realtimePostURL, Place::clientSection, "realtime_post_url", Type::text, "the post URL", WrongType::absent,
     "where realtime events go"},
    {Key::eventThreshold, Place::clientSection, "event_threshold", Type::textOrNumber, "0", WrongType::absent,
     "once more than so many events of one category wait, the whole batch is flushed; 0 flushes at the second"},
    {Key::extrasOnInternal, Place::clientSection, "extras_on_internal", Type::textOrNumber, "0", WrongType::absent,
     "not 0: internal builds post the device's own identifier as \"clientId\""},
    {Key::customClientID, Place::clientSection, "custom_clientId", Type::any, "as before", WrongType::never,
     "present: \"clientId\" is an identifier made for this client and service alone"},

    {Key::thresholdCountry, Place::countryThreshold, "country", Type::texts, "no country", WrongType::reportsNothing,
     "country codes, compared exactly"},
    {Key::threshold, Place::countryThreshold, "threshold", Type::textOrNumber, "no reports", WrongType::reportsNothing,
     "the threshold in these countries"},

    {Key::filterKey, Place::filterRule, "key", Type::text, "matches nothing", WrongType::reportsNothing,
     "name of a top-level field, in any case; no patterns, no nesting"},
    {Key::filterMethod, Place::filterRule, "method", Type::textOrNumber, "any", WrongType::reportsNothing,
     "category; negative: any"},
    {Key::filterStatus, Place::filterRule, "status", Type::textOrNumber, "any", WrongType::reportsNothing,
     "type; negative: any"},
    {Key::filterAction, Place::filterRule, "action", Type::text, "left as it is", WrongType::absent,
     "\"remove\", or \"sha256\": 64 lower-case hexadecimal digits over the UTF-8 text. Anything else (\"Remove\" too) "
     "leaves the field as it is, **and shields it from later rules**"},

    {Key::dashboardIP, Place::dashboardProfile, "ip", Type::any, "no backend", WrongType::never,
     "the server's dotted IPv4 address"},
    {Key::dashboardPort, Place::dashboardProfile, "port", Type::textOrNumber, "no backend", WrongType::zero,
     "its UDP port"},
    {Key::dashboardReliable, Place::dashboardProfile, "reliable", Type::textOrNumber, "not repeated",
     WrongType::standsForPeriod,
     "present: datagrams are acknowledged, repeated (at 2, 5, 10 and 19 periods) and given up at 20; the value is the "
     "period in milliseconds"},
    {Key::dashboardPostURL, Place::dashboardProfile, "post_url", Type::text, "no uploads", WrongType::absent,
     "where log data is uploaded"},
    {Key::dashboardDisplayURL, Place::dashboardProfile, "display_url", Type::text, "none", WrongType::absent,
     "a URL that clients may show to people"},

    {Key::uploadPostURL, Place::uploadProfile, "post_url", Type::text, "no backend", WrongType::absent,
     "where files are posted, gzip-compressed"},
    {Key::uploadDisplayURL, Place::uploadProfile, "display_url", Type::text, "none", WrongType::absent,
     "a URL that clients may show to people"},
};

constexpr bool hasOneRowAKey() {
  for (std::size_t i = 0; i < std::size(kKeys); ++i) {
    if (static_cast<std::size_t>(kKeys[i].key) != i) return false;
  }
  return static_cast<std::size_t>(Key::uploadDisplayURL) + 1 == std::size(kKeys);
}
static_assert(hasOneRowAKey(), "the rows stand in the order of the keys");

}  // namespace

std::span<const StorebagKeyInfo> storebagKeys() {
  return kKeys;
}

const StorebagKeyInfo& infoOf(StorebagKey key) {
  return kKeys[static_cast<std::size_t>(key)];
}

std::string_view nameOf(StorebagKey key) {
  return infoOf(key).name;
}

std::string_view describe(StorebagType type) {
  switch (type) {
    case Type::any:
      return "any";
    case Type::text:
      return "text";
    case Type::base64:
      return "base64 text";
    case Type::number:
      return "number";
    case Type::textOrNumber:
      return "number or its text";
    case Type::version:
      return "\"8.0.1\" or number";
    case Type::texts:
      return "list of texts";
    case Type::categories:
      return "list of numbers";
    case Type::section:
      return "profiles";
    case Type::profile:
      return "profile";
    case Type::clientSections:
      return "list of client sections";
    case Type::filterRules:
      return "list of filters";
    case Type::countryThresholds:
      return "list of country thresholds";
  }
  return {};
}

std::string_view describe(WrongType wrongType) {
  switch (wrongType) {
    case WrongType::never:
      return "cannot be";
    case WrongType::absent:
      return "as if absent";
    case WrongType::zero:
      return "0";
    case WrongType::fitsNoClient:
      return "fits no client";
    case WrongType::reportsNothing:
      return "section reports nothing";
    case WrongType::standsForPeriod:
      return "500, with a warning";
  }
  return {};
}

}  // namespace orvanta
